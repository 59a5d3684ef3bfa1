#include "kddlib/tagfile/StudyVolumes.h"

#include "kddlib/previews/QuadrantNavigation.h"
#include "kddlib/tagfile/StudyTree.h"
#include "kddlib/tagfile/format/VolumeIndex.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"
#include "kddlib/volumes/VolumeInfo.h"
#include "platform/base/LogFile.h"

#include <QSet>

#include <string>

namespace Kdd
{

namespace
{

const char* const kCategory = "TagFile";

}  // namespace

void StudyVolumes::add(const StudyTree& tree, const std::vector<VolumeInfo*>& infos)
{
    QSet<TagMap*> touched;
    int index = -1;
    for (const VolumeInfo* info : infos) {
        // Counted on for volumes that are left out too: the index is the place of the file in the list.
        ++index;
        const QVector<TagMap*> images = imagesOf(tree, *info, index);
        if (images.isEmpty())
            continue;
        TagMap* series = images.first()->parent();
        auto* volume = new Volume(index);
        volume->setInfo(*info, images);
        series->addBareVolume(volume);
        touched.insert(series);
    }
    // Once for each series at the end: nearly all images of one say the same, which then stands in the series.
    for (TagMap* series : qAsConst(touched))
        series->optimize(kVolumeIndex);
}

/// The images of a volume, all of one series, each told that it belongs to it.
QVector<TagMap*> StudyVolumes::imagesOf(const StudyTree& tree, const VolumeInfo& info, int volumeIndex)
{
    QVector<TagMap*> images;
    images.reserve(static_cast<int>(info.imageUIDs.size()));
    for (const std::string& uid : info.imageUIDs) {
        TagMap* image = tree.findImage(QByteArray::fromStdString(uid));
        // The file may be older than the study is now, or its image could not be read.
        if (image == nullptr || image->parent() == nullptr) {
            LogFile::tracef(2, kCategory, "3D volume %s contains unknown image %s", info.name.constData(),
                            uid.c_str());
            continue;
        }
        // A volume belongs to one series, and a reader looks for its images there only.
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

}  // namespace Kdd
