#pragma once

#include "kddlib/tagmodel/EncodedElements.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"

#include <unordered_map>
#include <vector>

namespace Kdd
{

/// A value that a child holds itself: in an element, or still in the bytes that it was read from.
struct TagMap::Held
{
    explicit Held(const TagElement& from)
        : Held({from.vr(), from.value().constData(), from.value().size()}, &from)
    {
    }
    explicit Held(const EncodedElements::Value& from, const TagElement* in = nullptr)
        : vr(from.vr)
        , size(from.size)
        , bytes(from.bytes)
        , element(in)
        , hash(qHashBits(bytes, static_cast<std::size_t>(size), static_cast<uint>(vr)))
    {
    }

    /// The element shares it.
    QByteArray value() const { return element != nullptr ? element->value() : QByteArray(bytes, size); }

    VrCode vr;
    int size;  // [bytes]
    const char* bytes;
    const TagElement* element;  // null while encoded
    uint hash;
};

/// What the children of a node hold themselves, by key. Of those that are encoded it stays valid as long as this.
class KDD_LOCAL TagMap::HeldValues
{
public:
    struct Entry
    {
        quint32 key;
        std::size_t next;  // the entry that came after it last
        std::vector<Held> held;
    };

    void addKey(const DcmTagKey& key) { obtain(packedKey(key)); }

    void add(const TagMap& child)
    {
        if (const EncodedElements::Pointer elements = child.encoded()) {
            if (mKept.empty() || mKept.back() != elements)
                mKept.push_back(elements);
            elements->visit(child.mPlace, [this](quint32 key, const EncodedElements::Value& value) {
                obtain(key).held.emplace_back(value);
            });
            return;
        }
        const Tags& own = child.tagsForLevel();
        for (auto it = own.cbegin(); it != own.cend(); ++it)
            obtain(packedKey(it.key())).held.emplace_back(*it.value());
    }

    const std::vector<Entry>& entries() const { return mEntries; }

private:
    /// Nearly all children hold the same keys in the same order.
    Entry& obtain(quint32 key)
    {
        const std::size_t guess = mEntries.empty() ? 0 : mEntries[mLast].next;
        if (guess < mEntries.size() && mEntries[guess].key == key)
            return mEntries[mLast = guess];
        const auto [at, isNew] = mPlaces.emplace(key, mEntries.size());
        if (isNew)
            mEntries.push_back({key, 0, {}});
        mEntries[mLast].next = at->second;
        return mEntries[mLast = at->second];
    }

    std::vector<Entry> mEntries;
    std::unordered_map<quint32, std::size_t> mPlaces;
    std::size_t mLast = 0;
    std::vector<EncodedElements::Pointer> mKept;
};

}  // namespace Kdd
