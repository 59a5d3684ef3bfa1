#include "kddlib/tagfile/StudyTree.h"
#include "kddlib/tagfile/qa/QAVolumes.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/VolumeInfo.h"

#include <algorithm>
#include <functional>

namespace Kdd
{

namespace
{

QVector<Slice> slicesOf(const VolumeInfo& info)
{
    QVector<Slice> slices;
    const auto count = static_cast<int>(info.imageUIDs.size());
    if (info.frameIdentifiers.empty()) {
        for (int i = 0; i < count; ++i)
            slices.append({i, 0});
        return slices;
    }
    // UIDs have dots themselves: the last one comes before the frame number.
    QHash<QByteArray, int> places;
    for (int i = 0; i < count; ++i)
        places.insert(QByteArray::fromStdString(info.imageUIDs.at(static_cast<std::size_t>(i))), i);
    for (const std::string& each : info.frameIdentifiers) {
        const QByteArray identifier = QByteArray::fromStdString(each);
        const int dot = identifier.lastIndexOf('.');
        slices.append({places.value(identifier.left(dot), -1), identifier.mid(dot + 1).toInt()});
    }
    return slices;
}

bool hasVolumeOf(const TagMap* series, const QByteArray& suffix)
{
    return series != nullptr &&
           std::any_of(series->volumes().begin(), series->volumes().end(),
                       [&](const Volume* volume) { return volume->fileNameSuffix() == suffix; });
}

}  // namespace

void QAVolumes::addDivided(StudyTree& tree, const VolumeInfo& info)
{
    QASeriesMove::Stack stack;
    for (const std::string& uid : info.imageUIDs)
        stack.images.append(QByteArray::fromStdString(uid));
    stack.volume.setSlices(slicesOf(info));
    // No columns: of a part nothing is known but the number of slices.
    stack.volume.setGeometry({0, 0, info.dims.z}, Box3f(), Mat4f());
    stack.volume.setPreviewData(info.preview);
    QASeriesMove move;
    move.source = &tree;
    move.stacks.push_back(stack);
    giveBack(tree, move);
}

void QAVolumes::keep(StudyTree& tree, StudyTree& former, const QSet<QByteArray>& suffixes)
{
    const auto isInVolume = [&tree](const QByteArray& key) {
        const TagMap* image = tree.findImage(key);
        return image != nullptr && image->findElement(kVolumeIndex) != nullptr;
    };
    for (TagMap* series : former.series()) {
        // Taken out with the names of the images, by which they are then looked for in the new tree.
        QASeriesMove move = takeOut(former, *series);
        move.source = &tree;
        const TagMap* present = tree.findSeries(move.seriesUID);
        const auto isToStay = [&](const QASeriesMove::Stack& stack) {
            const QByteArray suffix = stack.volume.fileNameSuffix();
            // A part of a divided volume does not say of which.
            const bool isPart = suffix.isEmpty() && stack.volume.isBareVolume();
            return isPart ? std::none_of(stack.images.begin(), stack.images.end(), isInVolume)
                          : suffixes.contains(suffix) && !hasVolumeOf(present, suffix);
        };
        move.stacks.erase(std::remove_if(move.stacks.begin(), move.stacks.end(), std::not_fn(isToStay)),
                          move.stacks.end());
        if (!move.stacks.empty())
            giveBack(tree, move);
    }
}

}  // namespace Kdd
