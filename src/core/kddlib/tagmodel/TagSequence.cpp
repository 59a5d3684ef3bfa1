#include "kddlib/tagmodel/TagSequence.h"

#include "kddlib/tagmodel/TagMap.h"

#include <dcmtk/dcmdata/dcitem.h>
#include <dcmtk/dcmdata/dcsequen.h>

namespace Kdd
{

TagSequence::TagSequence(const TagSequence& other)
    : TagElement(other)
    , mItems(other.mItems)
    , mOwnsItems(false)
{
}

TagSequence& TagSequence::operator=(const TagSequence& other)
{
    if (this == &other)
        return *this;
    release();
    TagElement::operator=(other);
    mItems = other.mItems;
    mOwnsItems = false;
    return *this;
}

TagSequence::~TagSequence()
{
    release();
}

void TagSequence::release()
{
    if (mOwnsItems)
        qDeleteAll(mItems);
    mItems.clear();
}

void TagSequence::clear()
{
    release();
    mOwnsItems = true;
}

void TagSequence::truncate(int count)
{
    while (mItems.size() > count)
        delete mItems.takeLast();
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
        if (mine == nullptr || theirs == nullptr || !mine->compare(*theirs, checkVR, diffs))
            return false;
    }
    return true;
}

DcmElement* TagSequence::createDcmElement(const DcmTagKey& key) const
{
    auto sequence = std::make_unique<DcmSequenceOfItems>(tagFor(key));
    for (const TagMap* map : mItems) {
        auto item = std::make_unique<DcmItem>();
        map->insertInto(*item);
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
        copy->addItem(map->clone());
    return copy.release();
}

}  // namespace Kdd
