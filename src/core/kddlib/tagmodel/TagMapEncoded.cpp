#include "kddlib/tagmodel/EncodedElements.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"

#include <array>
#include <cstdint>
#include <mutex>

namespace Kdd
{

namespace
{

/// Questions to a tree that nobody changes are asked by several threads here and there, so the one that comes first
/// decodes a node while the others wait. A lock in each node would cost more than what it guards.
std::mutex& lockOf(const TagMap* node)
{
    static std::array<std::mutex, 64> locks;
    return locks.at(reinterpret_cast<std::uintptr_t>(node) / 64 % locks.size());
}

}  // namespace

quint32 packedKey(const DcmTagKey& key)
{
    return static_cast<quint32>(key.getGroup()) << 16 | key.getElement();
}

DcmTagKey unpackedKey(quint32 key)
{
    return {static_cast<Uint16>(key >> 16), static_cast<Uint16>(key & 0xffff)};
}

void TagMap::keepEncoded(const EncodedElements& elements, int place)
{
    elements.ref.ref();
    mPlace = place;
    mEncoded.store(&elements, std::memory_order_release);
}

/// The pointer keeps the bytes when another thread decodes the node meanwhile.
EncodedElements::Pointer TagMap::encoded() const
{
    if (!isEncoded())
        return {};
    const std::lock_guard<std::mutex> lock(lockOf(this));
    return EncodedElements::Pointer(mEncoded.load(std::memory_order_relaxed));
}

void TagMap::decode() const
{
    const std::lock_guard<std::mutex> lock(lockOf(this));
    const EncodedElements* elements = mEncoded.load(std::memory_order_relaxed);
    if (elements == nullptr)
        return;
    TagMap decoded;
    elements->decode(mPlace, decoded);
    mTags.swap(decoded.mTags);
    mEncoded.store(nullptr, std::memory_order_release);
    if (!elements->ref.deref())
        delete elements;
}

/// Of a node that goes, so that nobody else asks.
void TagMap::dropEncoded()
{
    const EncodedElements* elements = mEncoded.exchange(nullptr);
    if (elements != nullptr && !elements->ref.deref())
        delete elements;
}

bool TagMap::holdsEncoded(const DcmTagKey& key) const
{
    const EncodedElements::Pointer elements = encoded();
    EncodedElements::Value value{};
    // Decoded meanwhile, it is looked up there.
    return elements == nullptr || elements->find(mPlace, key, value);
}

/// What `findElement` gives, for whoever only reads its value: in `copy`, where the node that holds it stays encoded.
const TagElement* TagMap::findValue(const DcmTagKey& key, TagElement& copy) const
{
    for (const TagMap* node = this; node != nullptr; node = node->mParent) {
        const TagElement* element = nullptr;
        if (const EncodedElements::Pointer elements = node->encoded()) {
            EncodedElements::Value value{};
            if (!elements->find(node->mPlace, key, value))
                continue;
            copy = TagElement(value.vr, QByteArray(value.bytes, value.size));
            element = &copy;
        } else {
            element = node->ownElement(key);
        }
        if (element != nullptr)
            return element->markedAsMissing() ? nullptr : element;
    }
    return nullptr;
}

}  // namespace Kdd
