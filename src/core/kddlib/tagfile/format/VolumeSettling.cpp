#include "kddlib/tagfile/format/VolumeSettling.h"

#include "kddlib/tagfile/format/VolumeIndex.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"
#include "platform/base/LogFile.h"

#include <QHash>

#include <algorithm>

namespace Kdd
{

namespace
{

/// One that only ever had a name is kept: nobody knows its images.
bool hasLostItsImages(const Volume& volume)
{
    return volume.numImages() == 0 && volume.slices().size() > 0;
}

/// Whether a reader finds the images of every volume; `arrange` tells it of one, given the images that it finds.
template <typename Arrange>
bool areFoundByReader(const TagMap& series, const Arrange& arrange)
{
    QVector<bool> haveSlices;
    for (const Volume* volume : series.volumes())
        haveSlices.append(volume->slices().size() > 0);
    QVector<VolumeShare> shares;
    return shareImages(series, haveSlices, shares) &&
           std::equal(shares.cbegin(), shares.cend(), series.volumes().cbegin(), arrange);
}

bool isBefore(const Volume* left, const Volume* right)
{
    return left->volumeIndex() < right->volumeIndex();
}

/// How many volumes each image is in.
QHash<const TagMap*, int> countVolumes(const QList<Volume*>& volumes)
{
    QHash<const TagMap*, int> counts;
    for (const Volume* volume : volumes) {
        for (int i = 0; i < volume->numImages(); ++i)
            ++counts[volume->image(i)];
    }
    return counts;
}

}  // namespace

/// A reader looks for the images of a volume in its own series only.
void VolumeSettling::releaseImagesOfOthers(const TagMap& series)
{
    for (Volume* volume : series.volumes()) {
        // A copy, for the volume's own list changes when it lets go of an image.
        const QVector<TagMap*> images = volume->images();
        for (int i = 0; i < images.size(); ++i) {
            if (images.at(i)->parent() == &series)
                continue;
            LogFile::warnf("Image %s leaves volume %d of series %s: it belongs to another series",
                           images.at(i)->uid(TagMap::ImageLevel).constData(), volume->volumeIndex(),
                           series.uid(TagMap::SeriesLevel).constData());
            volume->forgetImage(i);
        }
    }
}

Result VolumeSettling::settle(TagMap& series)
{
    // Three attempts, each changing more than the one before, so that a file that nobody touched is written again byte for
    // byte. Images that a reader finds in another order are put into that order.
    const auto arrange = [](const VolumeShare& share, Volume* volume) {
        return volume->arrangeLike(share.images);
    };
    releaseImagesOfOthers(series);
    if (series.volumes().isEmpty())
        return {};
    QList<Volume*>& volumes = series.obtainVolumes();
    for (int i = volumes.size() - 1; i >= 0; --i) {
        const Volume* volume = volumes.at(i);
        if (!hasLostItsImages(*volume))
            continue;
        LogFile::printf("Volume %d of series %s goes: it has lost its last image", volume->volumeIndex(),
                        series.uid(TagMap::SeriesLevel).constData());
        delete volumes.takeAt(i);
    }
    if (volumes.isEmpty() || areFoundByReader(series, arrange))
        return {};
    // Indexes may have come out of order, as when a sync made a volume that was missing.
    std::stable_sort(volumes.begin(), volumes.end(), isBefore);
    nameVolumes(series);
    if (areFoundByReader(series, arrange))
        return {};
    renumber(series);
    nameVolumes(series);
    if (areFoundByReader(series, arrange))
        return {};
    return Result::failure(QStringLiteral("the images of series %1 cannot tell its %2 volumes apart")
                               .arg(QString::fromLatin1(series.uid(TagMap::SeriesLevel)))
                               .arg(volumes.size()));
}

/// Indexes are places. An image of several volumes has a byte for each, so these get the first places; those for which
/// no byte is left are read from their files.
void VolumeSettling::renumber(TagMap& series)
{
    QList<Volume*>& volumes = series.obtainVolumes();
    const QHash<const TagMap*, int> counts = countVolumes(volumes);
    const auto sharesImages = [&](const Volume* volume) {
        for (int i = 0; i < volume->numImages(); ++i) {
            if (counts.value(volume->image(i)) > 1)
                return true;
        }
        return false;
    };
    if (volumes.size() > kVolumesToldApart)
        std::stable_partition(volumes.begin(), volumes.end(), sharesImages);
    for (int i = volumes.size() - 1; i >= kVolumesToldApart; --i) {
        const Volume* volume = volumes.at(i);
        if (!sharesImages(volume))
            continue;
        LogFile::errorf("Volume %s of series %s is left out of the tag file: more than %d share their images",
                        volume->fileNameSuffix().constData(), series.uid(TagMap::SeriesLevel).constData(),
                        kVolumesToldApart);
        delete volumes.takeAt(i);
    }
    for (int i = 0; i < volumes.size(); ++i)
        volumes.at(i)->mVolumeIndex = i;
}

}  // namespace Kdd
