#include "kddlib/tagmodel/TagSequence.h"

#include "kddlib/tagmodel/TagMap.h"

#include <dcmtk/dcmdata/dcitem.h>
#include <dcmtk/dcmdata/dcsequen.h>

#include <utility>

namespace Kdd
{

TagSequence::TagSequence(const TagSequence& other)
    : TagElement(other)
    , mItems(other.mItems)
    , mShared(other.mItems.size())
{
}

TagSequence& TagSequence::operator=(const TagSequence& other)
{
    TagElement::operator=(other);
    // A copy that is assigned back brings the items that are here; they stay with whom they belong to.
    if (mItems == other.mItems)
        return *this;
    clear();
    mItems = other.mItems;
    mShared = mItems.size();
    return *this;
}

TagSequence::~TagSequence()
{
    clear();
}

void TagSequence::addItem(TagMap* item)
{
    mItems.append(item != nullptr ? item->becomeItem() : nullptr);
}

const TagMap& TagSequence::itemToRead(int i) const
{
    static const TagMap empty;
    const TagMap* map = item(i);
    return map != nullptr ? *map : empty;
}

void TagSequence::truncate(int count)
{
    // The shared items at the head are another sequence's to delete.
    const QList<TagMap*> gone = mItems.mid(qMax(count, mShared));
    mItems = mItems.mid(0, count);
    mShared = qMin(mShared, mItems.size());
    qDeleteAll(gone);
}

void TagSequence::swapItems(TagSequence& other)
{
    mItems.swap(other.mItems);
    std::swap(mShared, other.mShared);
}

bool TagSequence::compare(const TagElement& other, bool checkVR, std::string* diffs) const
{
    if (!other.isSequence())
        return false;
    const auto& otherSequence = static_cast<const TagSequence&>(other);
    if (numItems() != otherSequence.numItems())
        return false;
    for (int i = 0; i < numItems(); ++i) {
        const TagMap* mine = item(i);
        const TagMap* theirs = otherSequence.item(i);
        // An item that is not there equals nothing: it cannot be known to be the same.
        if (mine == nullptr || theirs == nullptr || !mine->compare(*theirs, checkVR, diffs))
            return false;
    }
    return true;
}

DcmElement* TagSequence::createDcmElement(const DcmTagKey& key) const
{
    auto sequence = std::make_unique<DcmSequenceOfItems>(tagFor(key));
    for (int i = 0; i < numItems(); ++i) {
        auto item = std::make_unique<DcmItem>();
        // One that is not there becomes an empty item, so that those after it keep their numbers.
        itemToRead(i).insertInto(*item);
        sequence->append(item.release());
    }
    return sequence.release();
}

TagElement* TagSequence::clone() const
{
    auto copy = std::make_unique<TagSequence>();
    copy->putValue(value());
    copy->setVr(vr());
    for (TagMap* map : mItems)
        copy->addItem(map != nullptr ? map->clone() : nullptr);
    return copy.release();
}

}  // namespace Kdd
