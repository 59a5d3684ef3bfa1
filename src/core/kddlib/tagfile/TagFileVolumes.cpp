#include "kddlib/previews/QuadrantNavigation.h"
#include "kddlib/tagfile/NodeAttributes.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagfile/format/VolumeIndex.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"
#include "kddlib/volumes/VolumeInfo.h"
#include "platform/base/CreateUIDs.h"
#include "platform/base/LogFile.h"

#include <QSet>

#include <dcmtk/dcmdata/dcdeftag.h>

#include <memory>

namespace Kdd
{

namespace
{

const char* const kCategory = "TagFile";

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

void TagFile::addVolumeInfo(const std::vector<VolumeInfo*>& infos)
{
    QSet<TagMap*> touched;
    int index = -1;
    for (const VolumeInfo* info : infos) {
        ++index;
        const QVector<TagMap*> images = imagesOf(*info, index);
        if (images.isEmpty())
            continue;
        TagMap* series = images.first()->parent();
        auto* volume = new Volume(index);
        volume->setInfo(*info, images);
        series->addBareVolume(volume);
        touched.insert(series);
    }
    for (TagMap* series : qAsConst(touched))
        series->optimize(kVolumeIndex);
}

/// The images of a volume, all of one series, each told that it belongs to it.
QVector<TagMap*> TagFile::imagesOf(const VolumeInfo& info, int volumeIndex) const
{
    QVector<TagMap*> images;
    images.reserve(static_cast<int>(info.imageUIDs.size()));
    for (const std::string& uid : info.imageUIDs) {
        TagMap* image = findImage(QByteArray::fromStdString(uid));
        if (image == nullptr || image->parent() == nullptr) {
            LogFile::tracef(2, kCategory, "3D volume %s contains unknown image %s", info.name.constData(),
                            uid.c_str());
            continue;
        }
        if (!images.isEmpty() && image->parent() != images.first()->parent()) {
            LogFile::warnf("3D volume %s contains image %s of another series, %s", info.name.constData(),
                           uid.c_str(), image->uid(TagMap::SeriesLevel).constData());
            continue;
        }
        images.append(image);
        addVolumeIndex(*image, volumeIndex);
        if (info.quadrantData.size() >= QuadrantNavigation::kNumValues)
            QuadrantNavigation::store(info.quadrantData, *image);
    }
    return images;
}

void TagFile::createVolumes()
{
    // Volumes come from volume files alone; nothing is left to be made from the images.
}

Volume* Volume::duplicate(TagFile& tagFile, TagMap& series) const
{
    auto* copy = new Volume;
    series.addBareVolume(copy);
    copy->mSlices = slices();
    copy->setGeometry(mDims, mBoundingBox, mTransformation);
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
