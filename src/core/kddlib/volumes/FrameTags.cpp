#include "kddlib/volumes/FrameTags.h"

#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"
#include "kddlib/volumes/StackFrameReader.h"

#include <dcmtk/dcmdata/dcdeftag.h>

namespace Kdd
{

namespace
{

/// Null also for a sequence of which only the marker is kept: its items are not known here.
const TagSequence* sequenceOf(const TagMap& node, const DcmTagKey& key)
{
    const TagElement* element = node.findElement(key);
    return element != nullptr && element->isSequence() ? static_cast<const TagSequence*>(element) : nullptr;
}

const TagMap* itemOf(const TagMap& node, const DcmTagKey& key, int index)
{
    const TagSequence* sequence = sequenceOf(node, key);
    return sequence != nullptr && index < sequence->numItems() ? sequence->item(index) : nullptr;
}

}  // namespace

FrameTags::FrameTags(const TagMap& image, int frame)
    : mImage(&image)
    , mOwnGroups(itemOf(image, DCM_PerFrameFunctionalGroupsSequence, frame))
    , mSharedGroups(itemOf(image, DCM_SharedFunctionalGroupsSequence, 0))
{
}

QByteArray FrameTags::text(const DcmTagKey& group, const DcmTagKey& key) const
{
    QByteArray value;
    for (const TagMap* groups : {mOwnGroups, mSharedGroups}) {
        const TagMap* item = groups != nullptr ? itemOf(*groups, group, 0) : nullptr;
        if (item != nullptr && item->findAndGetString(key, value))
            return value.trimmed();
    }
    return text(key);
}

QByteArray FrameTags::text(const DcmTagKey& key) const
{
    QByteArray value;
    return mImage->findAndGetString(key, value) ? value.trimmed() : QByteArray();
}

int FrameTags::numFrameGroups(const TagMap& image)
{
    const TagSequence* sequence = sequenceOf(image, DCM_PerFrameFunctionalGroupsSequence);
    return sequence != nullptr ? sequence->numItems() : 0;
}

}  // namespace Kdd
