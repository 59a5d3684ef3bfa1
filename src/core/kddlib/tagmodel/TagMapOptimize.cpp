#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"

#include <dcmtk/dcmdata/dcdeftag.h>

#include <cstring>
#include <unordered_map>
#include <utility>
#include <vector>

namespace Kdd
{

namespace
{

// What an attribute costs in the file: key, VR and length before the value; a marker has no length.
constexpr qint64 kElementCost = 7;
constexpr qint64 kMissingCost = 5;

// Each modification of an object adds an item, so the sequence has no bound of its own.
constexpr int kOriginalAttributesKept = 4;

qint64 costOf(const TagElement& element)
{
    return element.value().size() + kElementCost;
}

struct HashOfValue
{
    std::size_t operator()(const TagElement* element) const
    {
        return qHash(element->value(), static_cast<uint>(element->vr()));
    }
};

struct SameValue
{
    bool operator()(const TagElement* left, const TagElement* right) const
    {
        return left->vr() == right->vr() && left->value() == right->value();
    }
};

/// By length, bytes and VR: of equally frequent values the first is the cheapest.
bool comesFirst(const TagElement& left, const TagElement& right)
{
    const QByteArray& mine = left.value();
    const QByteArray& theirs = right.value();
    if (mine.size() != theirs.size())
        return mine.size() < theirs.size();
    const int order =
        std::memcmp(mine.constData(), theirs.constData(), static_cast<std::size_t>(mine.size()));
    return order != 0 ? order < 0 : left.vr() < right.vr();
}

/// What the children of a node see under one key, and what that costs where it stands now.
class Survey
{
public:
    /// `held` is what children hold themselves, `shown` what the node shows and the other children see.
    Survey(const std::vector<const TagElement*>& held, const TagElement* shown, int children)
    {
        mCosts.reserve(held.size());
        for (std::size_t i = 0; i < held.size(); ++i) {
            // The elements lie all over the memory; without a hint most of the time is spent waiting for them.
            if (i + 2 * kLookAhead < held.size())
                __builtin_prefetch(held[i + 2 * kLookAhead]);
            if (i + kLookAhead < held.size())
                __builtin_prefetch(held[i + kLookAhead]->value().constData());
            add(*held[i]);
        }
        // What children inherit costs nothing where it stands, but would have to be held by each if it went.
        const int inheriting = children - static_cast<int>(held.size());
        mAbsent = mMissing + (shown == nullptr ? inheriting : 0);
        if (shown == nullptr)
            return;
        mCurrent += costOf(*shown);
        // An inherited value that is a sequence makes the key one, even if no child holds it.
        mIsSequence = mIsSequence || shown->vr() == VrCode::SQ;
        if (inheriting > 0)
            mCosts[shown] += inheriting * costOf(*shown);
    }

    bool isSequence() const { return mIsSequence; }
    bool isMissing() const { return mMissing > 0; }
    bool seesNothing() const { return mCosts.empty(); }

    /// The value that costs the children most; there has to be one. Of several the first by a fixed order, because the
    /// table has none and a study must be written to the same bytes every time.
    const TagElement& best() const
    {
        auto best = mCosts.cbegin();
        for (auto it = mCosts.cbegin(); it != mCosts.cend(); ++it) {
            if (it->second > best->second ||
                (it->second == best->second && comesFirst(*it->first, *best->first)))
                best = it;
        }
        return *best->first;
    }

    qint64 currentCost() const { return mCurrent; }

    /// When every child holds its own value.
    qint64 costBelow() const
    {
        qint64 total = 0;
        for (const auto& entry : mCosts)
            total += entry.second;
        return total;
    }

    /// When the node holds `value` and children only what differs.
    qint64 costWith(const TagElement& value) const
    {
        return costBelow() - mCosts.at(&value) + costOf(value) + kMissingCost * mAbsent;
    }

private:
    static constexpr std::size_t kLookAhead = 8;

    void add(const TagElement& own)
    {
        if (own.markedAsMissing()) {
            ++mMissing;
            mCurrent += kMissingCost;
            return;
        }
        mCurrent += costOf(own);
        mCosts[&own] += costOf(own);
        mIsSequence = mIsSequence || own.vr() == VrCode::SQ;
    }

    std::unordered_map<const TagElement*, qint64, HashOfValue, SameValue> mCosts;  // children's cost by value
    qint64 mCurrent = 0;
    int mMissing = 0;
    int mAbsent = 0;
    bool mIsSequence = false;
};

bool isOverlayData(const DcmTagKey& key)
{
    return key.getGroup() >= 0x6000 && key.getGroup() <= 0x601e && key.getElement() == 0x3000;
}

bool isNeededByClient(const DcmTagKey& key, const TagElement& element)
{
    return element.vr() != VrCode::UN && key != DCM_VOILUTSequence && key != DCM_PresentationLUTSequence &&
           key != DCM_ModalityLUTSequence && !isOverlayData(key);
}

/// A key of the caller's may stand in a map that loses the entry meanwhile.
DcmTagKey ownKey(const DcmTagKey& key)
{
    return {key.getGroup(), key.getElement()};
}

quint32 packed(const DcmTagKey& key)
{
    return static_cast<quint32>(key.getGroup()) << 16 | key.getElement();
}

DcmTagKey unpacked(quint32 key)
{
    return {static_cast<Uint16>(key >> 16), static_cast<Uint16>(key & 0xffff)};
}

}  // namespace

void TagMap::optimize(const DcmTagKey& key)
{
    Elements held;
    for (const TagMap* child : qAsConst(mChildren)) {
        if (const TagElement* own = child->ownElement(key))
            held.push_back(own);
    }
    place(ownKey(key), held);
}

/// Keys do not influence each other, so one walk over the children finds what they hold for all of them: looking
/// every key up in every child takes several times as long.
void TagMap::optimizeAll()
{
    if (mChildren.isEmpty())
        return;
    std::unordered_map<quint32, Elements> heldByKey;
    // Keys that no child holds are looked at too: a marker here at
    // the root, for example, has nothing to hide.
    for (auto it = mTags.cbegin(); it != mTags.cend(); ++it)
        heldByKey[packed(it.key())];
    for (const TagMap* child : qAsConst(mChildren)) {
        for (auto it = child->mTags.cbegin(); it != child->mTags.cend(); ++it)
            heldByKey[packed(it.key())].push_back(it.value());
    }
    for (const auto& [key, held] : heldByKey)
        place(unpacked(key), held);
}

/// `held` is what the children hold themselves under the key.
void TagMap::place(const DcmTagKey& key, const Elements& held)
{
    if (mChildren.isEmpty())
        return;
    const Survey survey(held, findElement(key), mChildren.size());
    // Sequences have items and no bytes, so their cost is not known; attaching has placed them.
    if (survey.isSequence())
        return;
    if (survey.seesNothing()) {
        forgetUnseen(key, survey.isMissing());
        return;
    }
    const TagElement& best = survey.best();
    const qint64 costHere = survey.costWith(best);
    const qint64 costBelow = survey.costBelow();
    // Only for a gain: at equal cost everything stays, so that a second pass finds nothing to move.
    if (costBelow < costHere && costBelow < survey.currentCost())
        storeOptionA(key);
    else if (costHere < survey.currentCost())
        // The bytes are held on to, because the child that `best` belongs to loses it on the way.
        storeHere(key, best.vr(), QByteArray(best.value()), Match::BytesAndVr);
}

/// No child sees a value: at the root of the tree nothing needs to be hidden either.
void TagMap::forgetUnseen(const DcmTagKey& key, bool childrenAreMarked)
{
    if (mParent != nullptr)
        return;
    deleteElement(key);
    if (!childrenAreMarked)
        return;
    for (TagMap* child : qAsConst(mChildren))
        child->deleteElement(key);
}

void TagMap::storeOptionA(const DcmTagKey& keyGiven)
{
    const DcmTagKey key = ownKey(keyGiven);
    const TagElement* shown = findElement(key);
    for (TagMap* child : qAsConst(mChildren)) {
        const TagElement* own = child->ownElement(key);
        if (own != nullptr && own->markedAsMissing())
            child->deleteElement(key);
        else if (own == nullptr && shown != nullptr)
            child->putElement(key, shown->clone());
    }
    // What a node further up shows would come through once the own
    // value is gone, so there it has to be hidden.
    if (mParent == nullptr || mParent->findElement(key) == nullptr) {
        deleteElement(key);
        return;
    }
    // The marker may keep its bytes, which no reader asks for; items would be written with it.
    TagElement* own = ownElement(key);
    if (own != nullptr && !own->isSequence())
        own->setVr(VrCode::Missing);
    else
        markAsMissing(key);
}

void TagMap::storeOptionB(const DcmTagKey& key, VrCode vr, QByteArray value)
{
    storeHere(ownKey(key), vr, std::move(value), Match::Bytes);
}

/// Whether `element` may be dropped in favour of the value. With `BytesAndVr` a child never changes what it shows:
/// the same two bytes are another number as US than as SS.
bool TagMap::equals(const TagElement& element, VrCode vr, const QByteArray& value, Match match)
{
    // A sequence has no bytes either, but items.
    if (element.isSequence() || element.value() != value)
        return false;
    // An omitted value has no bytes either, but it is not empty.
    return match == Match::BytesAndVr || element.markedAsOmitted() || vr == VrCode::Omitted
               ? element.vr() == vr
               : true;
}

void TagMap::storeHere(const DcmTagKey& key, VrCode vr, QByteArray value, Match match)
{
    const TagElement* shown = findElement(key);
    for (TagMap* child : qAsConst(mChildren)) {
        const TagElement* own = child->ownElement(key);
        if (own != nullptr) {
            if (!own->markedAsMissing() && equals(*own, vr, value, match))
                child->deleteElement(key);
        } else if (shown == nullptr) {
            child->markAsMissing(key);
        } else if (!equals(*shown, vr, value, match)) {
            child->putElement(key, shown->clone());
        }
    }
    // Last, because what the children were given copies of may be this node's own element.
    TagElement* here = plainElement(key);
    here->value() = std::move(value);
    here->setVr(vr);
}

void TagMap::removeTagsNotNeededByClient()
{
    for (auto it = mTags.begin(); it != mTags.end();) {
        if (isNeededByClient(it.key(), *it.value())) {
            ++it;
        } else {
            delete it.value();
            it = mTags.erase(it);
        }
    }
    TagElement* original = ownElement(DCM_OriginalAttributesSequence);
    if (original != nullptr && original->isSequence())
        static_cast<TagSequence*>(original)->truncate(kOriginalAttributesKept);
    if (mVolumes != nullptr)
        mVolumes->forgetFileSuffixes();
    for (TagMap* child : qAsConst(mChildren))
        child->removeTagsNotNeededByClient();
}

}  // namespace Kdd
