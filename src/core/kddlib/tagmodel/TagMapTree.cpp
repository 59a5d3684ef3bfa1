#include "kddlib/tagmodel/EncodedElements.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"

#include <dcmtk/dcmdata/dcdeftag.h>

#include <algorithm>
#include <memory>
#include <vector>

namespace Kdd
{

namespace
{

/// The attribute that names a node of the level; false when the level has none.
bool uidKey(TagMap::Level level, DcmTagKey& key)
{
    switch (level) {
    case TagMap::ImageLevel:
        key = DCM_SOPInstanceUID;
        return true;
    case TagMap::SeriesLevel:
        key = DCM_SeriesInstanceUID;
        return true;
    case TagMap::StudyLevel:
        key = DCM_StudyInstanceUID;
        return true;
    case TagMap::ItemLevel:
        break;
    }
    return false;
}

TagSequence* asSequence(TagElement* element)
{
    return element != nullptr && element->isSequence() ? static_cast<TagSequence*>(element) : nullptr;
}

}  // namespace

/// The copy counts as taken out: it inherits from the parent, but the
/// parent's list names the source, not the copy.
TagMap::TagMap(const TagMap& other)
    : mParent(other.mParent)
    , mChildren(other.mChildren)
    , mVolumes(other.mVolumes != nullptr ? other.mVolumes->share() : nullptr)
    , mTags(other.tagsForLevel())
    , mIsSequenceItem(other.mIsSequenceItem)
    , mIsTakenOut(true)
    , mOwns(false)
{
}

TagMap& TagMap::operator=(const TagMap& other)
{
    // A copy that is assigned back brings what is here; that stays with whom it belongs to. It is told by what it holds
    // and not by where it stands, because the copy of a copy brings the same.
    const bool isEmpty = tagsForLevel().isEmpty() && mChildren.isEmpty() && volumes().isEmpty();
    if (!isEmpty && mTags == other.tagsForLevel() && mChildren == other.mChildren &&
        volumes() == other.volumes())
        return *this;
    if (this == &other)
        return *this;
    if (mOwns)
        releaseAll();
    mParent = other.mParent;
    mChildren = other.mChildren;
    mVolumes = other.mVolumes != nullptr ? other.mVolumes->share() : nullptr;
    mTags = other.tagsForLevel();
    mIsSequenceItem = other.mIsSequenceItem;
    mIsTakenOut = true;
    mOwns = false;
    return *this;
}

TagMap::~TagMap()
{
    if (mOwns)
        releaseAll();
}

/// Children go before elements: their items hang below items of this node and would otherwise first copy all that
/// they inherit, only to be deleted next.
void TagMap::releaseAll()
{
    clearVolumes();
    leaveVolumes();
    // A list of its own: an item that stands alone takes itself out of the other while it is walked.
    const QList<TagMap*> children = mChildren;
    for (TagMap* child : children) {
        if (mIsSequenceItem) {
            // Items below an item belong to sequences of their own, which still show them.
            child->standAlone();
        } else {
            // Unhooked, so that it need not look itself up in a list that goes as well.
            child->mParent = nullptr;
            delete child;
        }
    }
    mChildren.clear();
    dropEncoded();
    qDeleteAll(mTags);
    mTags.clear();
    forgetParent();
}

/// In constant time for the first and the last child, so that taking all children away one by one is linear.
void TagMap::forgetParent()
{
    if (hangs())
        mParent->removeChildMap(this);
    mParent = nullptr;
    mIsTakenOut = false;
}

bool TagMap::removeChildMap(TagMap* child)
{
    if (mChildren.isEmpty())
        return false;
    if (mChildren.first() == child)
        mChildren.removeFirst();
    else if (mChildren.last() == child)
        mChildren.removeLast();
    else if (!mChildren.removeOne(child))
        return false;
    child->mIsTakenOut = true;
    // Volumes belong to this node, and name no image that is not one of its own.
    child->leaveVolumes();
    return true;
}

void TagMap::appendChild(TagMap* child)
{
    child->mParent = this;
    child->mIsTakenOut = false;
    mChildren.append(child);
}

TagElement* TagMap::removeUID(Level level)
{
    DcmTagKey key;
    return uidKey(level, key) ? tagsForLevel().take(key) : nullptr;
}

void TagMap::insertUID(Level level, TagElement* uid)
{
    DcmTagKey key;
    if (uid != nullptr && uidKey(level, key))
        putElement(key, uid);
}

QByteArray TagMap::uid(Level level) const
{
    DcmTagKey key;
    TagElement copy;
    const TagElement* element = uidKey(level, key) ? findValue(key, copy) : nullptr;
    if (element == nullptr)
        return {};
    QByteArray text = element->value();
    // Padding is dropped when a value is read as a text; one of VR UN still has it.
    while (text.endsWith('\0') || text.endsWith(' '))
        text.chop(1);
    return text;
}

void TagMap::addChildMap(TagMap* child, Level level)
{
    if (child->hangs()) {
        if (child->mParent == this)
            return;
        child->standAlone();
    }
    // The UID is taken out first: the node above has one of another image, or must not receive this one's.
    TagElement* uid = child->removeUID(level);
    // The first image of a series brings all that the series is to say, in place of what stood there. An item
    // has values of its own, which its sequence shows.
    if (mChildren.isEmpty() && !mIsSequenceItem)
        adoptFrom(child);
    else
        child->dropWhatParentShows(*this);
    child->insertUID(level, uid);
    mChildren.append(child);
    child->mParent = this;
    child->mIsTakenOut = false;
}

/// An item below another item stays there and inherits; a node that others own can only be had whole. Only one sequence
/// deletes an item, so a second one gets a copy.
TagMap* TagMap::becomeItem()
{
    if (mIsInSequence)
        return clone()->becomeItem();
    if (hangs() && !mParent->mIsSequenceItem)
        standAlone();
    mIsSequenceItem = true;
    mIsInSequence = true;
    return this;
}

void TagMap::adoptFrom(TagMap* child)
{
    qDeleteAll(tagsForLevel());
    mTags.clear();
    mTags.swap(child->tagsForLevel());
    // A series that has lost all its images still hangs below its study: without this step the new image would
    // inherit whatever the study shows and the image lacks.
    if (mParent != nullptr)
        dropWhatParentShows(*mParent);
}

/// Both sides are walked once, in key order: looking each key up would cost a walk up the tree for every one.
void TagMap::dropWhatParentShows(const TagMap& parent)
{
    auto own = tagsForLevel().begin();
    const iterator end = parent.end();
    for (iterator shown = parent.begin(); shown != end; ++shown) {
        while (own != mTags.end() && own.key() < shown.key())
            ++own;
        if (own == mTags.end() || shown.key() < own.key()) {
            own = mTags.insert(own, shown.key(), new TagElement(VrCode::Missing, QByteArray()));
            ++own;
            shown.value()->countMissing();
        } else if (shown.value()->compare(*own.value(), true, nullptr)) {
            delete own.value();
            own = mTags.erase(own);
        } else {
            if (shown.value()->isSequence() && own.value()->isSequence())
                attachItems(*asSequence(shown.value()), *asSequence(own.value()));
            shown.value()->countDiffering();
            ++own;
        }
    }
}

void TagMap::attachItems(const TagSequence& parentSequence, const TagSequence& childSequence)
{
    for (int i = 0; i < qMin(parentSequence.numItems(), childSequence.numItems()); ++i) {
        TagMap* above = parentSequence.item(i);
        TagMap* item = childSequence.item(i);
        // An item that is not there gives nothing and takes nothing.
        if (above == nullptr || item == nullptr)
            continue;
        item->standAlone();
        above->addChildMap(item, ItemLevel);
    }
}

TagMap* TagMap::clone() const
{
    auto copy = std::make_unique<TagMap>();
    copy->mIsSequenceItem = mIsSequenceItem;
    const iterator last = end();
    for (iterator it = begin(); it != last; ++it)
        copy->mTags.insert(copy->mTags.cend(), it.key(), it.value()->clone());
    return copy.release();
}

void TagMap::copyFromParent()
{
    if (mParent == nullptr)
        return;
    const Tags& above = mParent->tagsForLevel();
    Tags& own = tagsForLevel();
    for (auto it = above.cbegin(); it != above.cend(); ++it) {
        if (!own.contains(it.key()))
            own.insert(it.key(), it.value()->clone());
    }
}

void TagMap::detachItems()
{
    // Encoded ones hang nowhere.
    if (isEncoded())
        return;
    for (TagElement* element : qAsConst(mTags)) {
        const TagSequence* sequence = asSequence(element);
        for (int i = 0; sequence != nullptr && i < sequence->numItems(); ++i) {
            if (TagMap* item = sequence->item(i))
                item->standAlone();
        }
    }
}

/// Takes over what this item inherits and lets go of its parent. Its nested items come first: they hang below items
/// that this one sees only through its parent.
void TagMap::standAlone()
{
    if (mParent == nullptr)
        return;
    detachItems();
    Tags all;
    const iterator last = end();
    for (iterator it = begin(); it != last; ++it) {
        const bool isOwn = ownElement(it.key()) == it.value();
        // The view comes in key order, so the end is always the right place.
        all.insert(all.cend(), it.key(), isOwn ? it.value() : it.value()->clone());
    }
    // The view shows no markers, so they are in nobody's hands; without a parent they have nothing to hide.
    for (TagElement* element : qAsConst(mTags)) {
        if (element->markedAsMissing())
            delete element;
    }
    mTags.swap(all);
    forgetParent();
}

void TagMap::relinkItems()
{
    relinkOwnItems();
    for (TagMap* child : qAsConst(mChildren))
        child->relinkItems();
}

/// Whether the node above shows a sequence where this one holds one. It may have come there since this node was read.
bool TagMap::mayRelinkEncoded(const EncodedElements& elements) const
{
    std::vector<DcmTagKey> sequences;
    elements.visit(mPlace, [&](quint32 key, const EncodedElements::Value& value) {
        if (value.vr == VrCode::SQ)
            sequences.push_back(unpackedKey(key));
    });
    return std::any_of(sequences.begin(), sequences.end(), [this](const DcmTagKey& key) {
        return mParent != nullptr && asSequence(mParent->findElement(key)) != nullptr;
    });
}

void TagMap::relinkOwnItems()
{
    const EncodedElements::Pointer elements = encoded();
    if (elements && !mayRelinkEncoded(*elements))
        return;
    const Tags& own = tagsForLevel();
    for (auto it = own.cbegin(); it != own.cend(); ++it) {
        const TagSequence* sequence = asSequence(it.value());
        if (sequence == nullptr)
            continue;
        // What the parent shows and not what it holds: the sequence may stand one node further up.
        const TagSequence* above = mParent != nullptr ? asSequence(mParent->findElement(it.key())) : nullptr;
        for (int i = 0; i < sequence->numItems(); ++i) {
            TagMap* item = sequence->item(i);
            if (item == nullptr)
                continue;
            // Before what is nested in it: where nested items hang is decided by what this one shows.
            item->hangBelow(above != nullptr && i < above->numItems() ? above->item(i) : nullptr);
            item->relinkOwnItems();
        }
    }
}

void TagMap::hangBelow(TagMap* item)
{
    // Where it hangs already, standing alone first would copy all it inherits only to drop it again.
    if (mParent == item && !mIsTakenOut)
        return;
    standAlone();
    if (item != nullptr)
        item->addChildMap(this, ItemLevel);
}

}  // namespace Kdd
