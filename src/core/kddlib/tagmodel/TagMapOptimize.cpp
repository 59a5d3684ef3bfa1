#include "kddlib/tagmodel/HeldValues.h"
#include "kddlib/tagmodel/TagSequence.h"

#include <dcmtk/dcmdata/dcdeftag.h>

#include <cstring>
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

/// What the children of a node see under one key, and what that costs where it stands now.
template <typename Held>
class Survey
{
public:
    /// `held` is what children hold themselves, `shown` what the node shows and the other children see.
    Survey(const std::vector<Held>& held, const Held* shown, int children)
    {
        std::size_t count = 4;
        while (count < 2 * (held.size() + 1))
            count *= 2;
        mSlots.assign(count, -1);
        for (std::size_t i = 0; i < held.size(); ++i) {
            // Equal values lie all over the memory; without a hint most of the time is spent waiting for them.
            if (i + kLookAhead < held.size())
                __builtin_prefetch(held[i + kLookAhead].bytes);
            add(held[i]);
        }
        // What children inherit costs nothing where it stands, but would have to be held by each if it went.
        const int inheriting = children - static_cast<int>(held.size());
        mAbsent = mMissing + (shown == nullptr ? inheriting : 0);
        if (shown == nullptr)
            return;
        mCurrent += costOf(*shown);
        // An inherited value that is a sequence makes the key one, even if no child holds it.
        mIsSequence = mIsSequence || shown->vr == VrCode::SQ;
        if (inheriting > 0)
            addCost(*shown, inheriting * costOf(*shown));
    }

    bool isSequence() const { return mIsSequence; }
    bool isMissing() const { return mMissing > 0; }
    bool seesNothing() const { return mValues.empty(); }

    /// The value that costs the children most; there has to be one. Of several the first by a fixed order, because a study
    /// must be written to the same bytes every time.
    const Held& best() const { return *bestEntry().value; }

    qint64 currentCost() const { return mCurrent; }

    /// When every child holds its own value.
    qint64 costBelow() const
    {
        qint64 total = 0;
        for (const Entry& entry : mValues)
            total += entry.cost;
        return total;
    }

    /// When the node holds the best value and children only what differs.
    qint64 costHere() const
    {
        const Entry& entry = bestEntry();
        return costBelow() - entry.cost + costOf(*entry.value) + kMissingCost * mAbsent;
    }

private:
    static constexpr std::size_t kLookAhead = 8;

    /// What one value costs the children together.
    struct Entry
    {
        const Held* value;
        qint64 cost;
    };

    static qint64 costOf(const Held& value) { return value.size + kElementCost; }

    static int compareBytes(const Held& left, const Held& right)
    {
        return left.size == 0 ? 0 : std::memcmp(left.bytes, right.bytes, static_cast<std::size_t>(left.size));
    }

    static bool isSame(const Held& left, const Held& right)
    {
        return left.hash == right.hash && left.vr == right.vr && left.size == right.size &&
               compareBytes(left, right) == 0;
    }

    /// By length, bytes and VR: of equally frequent values the first is the cheapest.
    static bool comesFirst(const Held& left, const Held& right)
    {
        if (left.size != right.size)
            return left.size < right.size;
        const int order = compareBytes(left, right);
        return order != 0 ? order < 0 : left.vr < right.vr;
    }

    const Entry& bestEntry() const
    {
        const Entry* best = &mValues.front();
        for (const Entry& entry : mValues) {
            if (entry.cost > best->cost ||
                (entry.cost == best->cost && comesFirst(*entry.value, *best->value)))
                best = &entry;
        }
        return *best;
    }

    void add(const Held& own)
    {
        if (own.vr == VrCode::Missing) {
            ++mMissing;
            mCurrent += kMissingCost;
            return;
        }
        mCurrent += costOf(own);
        addCost(own, costOf(own));
        mIsSequence = mIsSequence || own.vr == VrCode::SQ;
    }

    /// A table without removal, in which whatever has no free slot stands in one of the next.
    void addCost(const Held& value, qint64 cost)
    {
        std::size_t slot = value.hash & (mSlots.size() - 1);
        while (mSlots[slot] >= 0 && !isSame(*mValues[static_cast<std::size_t>(mSlots[slot])].value, value))
            slot = (slot + 1) & (mSlots.size() - 1);
        if (mSlots[slot] < 0) {
            mSlots[slot] = static_cast<int>(mValues.size());
            mValues.push_back({&value, 0});
        }
        mValues[static_cast<std::size_t>(mSlots[slot])].cost += cost;
    }

    std::vector<Entry> mValues;
    std::vector<int> mSlots;  // of values by their hash, -1 where there is none
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

}  // namespace

void TagMap::optimize(const DcmTagKey& key)
{
    std::vector<Held> held;
    std::vector<EncodedElements::Pointer> kept;
    for (const TagMap* child : qAsConst(mChildren)) {
        if (const EncodedElements::Pointer elements = child->encoded()) {
            EncodedElements::Value value{};
            if (elements->find(child->mPlace, key, value))
                held.emplace_back(value);
            kept.push_back(elements);
        } else if (const TagElement* own = child->ownElement(key)) {
            held.emplace_back(*own);
        }
    }
    place(ownKey(key), held);
}

/// Keys do not influence each other, so one walk over the children finds what they hold for all of them: looking
/// every key up in every child takes several times as long.
void TagMap::optimizeAll()
{
    if (mChildren.isEmpty())
        return;
    HeldValues values;
    // Keys that no child holds are looked at too: a marker here at
    // the root, for example, has nothing to hide.
    const Tags& own = tagsForLevel();
    for (auto it = own.cbegin(); it != own.cend(); ++it)
        values.addKey(it.key());
    for (const TagMap* child : qAsConst(mChildren))
        values.add(*child);
    for (const HeldValues::Entry& entry : values.entries())
        place(unpackedKey(entry.key), entry.held);
}

/// `held` is what the children hold themselves under the key.
void TagMap::place(const DcmTagKey& key, const std::vector<Held>& held)
{
    if (mChildren.isEmpty())
        return;
    std::vector<Held> shown;
    if (const TagElement* element = findElement(key))
        shown.emplace_back(*element);
    const Survey<Held> survey(held, shown.empty() ? nullptr : shown.data(), mChildren.size());
    // Sequences have items and no bytes, so their cost is not known; attaching has placed them.
    if (survey.isSequence())
        return;
    if (survey.seesNothing()) {
        forgetUnseen(key, survey.isMissing());
        return;
    }
    const qint64 costHere = survey.costHere();
    const qint64 costBelow = survey.costBelow();
    // Only for a gain: at equal cost everything stays, so that a second pass finds nothing to move.
    if (costBelow < costHere && costBelow < survey.currentCost())
        storeOptionA(key);
    else if (costHere < survey.currentCost())
        // The bytes are held on to, because the child that the value belongs to loses it on the way.
        storeHere(key, survey.best().vr, survey.best().value(), Match::BytesAndVr);
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
    Tags& own = tagsForLevel();
    for (auto it = own.begin(); it != own.end();) {
        if (isNeededByClient(it.key(), *it.value())) {
            ++it;
        } else {
            delete it.value();
            it = own.erase(it);
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
