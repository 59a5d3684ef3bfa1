#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"
#include "platform/base/CreateUIDs.h"

#include <dcmtk/dcmdata/dcdeftag.h>

#include <memory>

namespace Kdd
{

namespace
{

/// What a copied image takes over from the series that it becomes part of.
const DcmTagKey kSeriesIdentity[] = {DCM_StudyInstanceUID,  DCM_SeriesInstanceUID, DCM_SeriesNumber,
                                     DCM_SeriesDescription, DCM_SeriesDate,        DCM_SeriesTime};

TagMap* copyInto(const TagMap& series, const TagMap& image, int volumeIndex)
{
    std::unique_ptr<TagMap> copy(image.clone());
    for (const DcmTagKey& key : kSeriesIdentity) {
        QByteArray text;
        if (series.findAndGetString(key, text))
            copy->putAndInsertString(key, text);
    }
    copy->putAndInsertString(DCM_SOPInstanceUID, CreateUIDs::createUID(CreateUIDs::Instance));
    copy->putAndInsertInt(kVolumeIndex, volumeIndex);
    return copy.release();
}

}  // namespace

// Here, because the copies become images of a tag file, and volumes know nothing of those.
Volume* Volume::duplicate(TagFile& tagFile, TagMap& series) const
{
    auto* copy = new Volume;
    series.addBareVolume(copy);
    copy->mSlices = slices();
    copy->setGeometry(mDims, mBoundingBox, mTransformation);
    // As they are, even when nothing was computed yet: to ask for them would compute them for the source too.
    copy->mRescaleSlope = mRescaleSlope;
    copy->mRescaleIntercept = mRescaleIntercept;
    copy->setPadding(mPaddingValue, mPaddingRangeLimit);
    QVector<TagMap*> placed;
    placed.reserve(numImages());
    for (const TagMap* image : images())
        placed.append(tagFile.addTagMap(copyInto(series, *image, copy->mVolumeIndex), nullptr, false));
    // Slices are those of the images at the same places, so one that was not placed is a gap.
    copy->mImages.set(placed);
    series.optimizeAll();
    if (series.parent() != nullptr)
        series.parent()->optimizeAll();
    return copy;
}

}  // namespace Kdd
