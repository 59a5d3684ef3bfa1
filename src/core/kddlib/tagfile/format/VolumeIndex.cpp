#include "kddlib/tagfile/format/VolumeIndex.h"

#include "kddlib/Limits.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"

#include <QMap>

#include <vector>

namespace Kdd
{

namespace
{

using ImagesByVolume = QMap<int, QVector<TagMap*>>;

/// The indexes in ascending order, each once. An image of several volumes has a byte for each of them.
QVector<int> volumeIndexes(const TagElement& element)
{
    if (element.vr() != VrCode::OB) {
        bool ok = false;
        // An index that one byte does not hold is stored as a longer number, and is then the only one.
        const int index = element.valueAsInt(&ok, 0);
        return ok ? QVector<int>{index} : QVector<int>();
    }
    std::vector<bool> isNamed(kVolumesToldApart);
    for (const char byte : element.value())
        isNamed[static_cast<quint8>(byte)] = true;
    QVector<int> indexes;
    for (int i = 0; i < kVolumesToldApart; ++i) {
        if (isNamed[static_cast<std::size_t>(i)])
            indexes.append(i);
    }
    return indexes;
}

/// False when there are too many.
bool findImages(const TagMap& series, ImagesByVolume& found)
{
    // Mostly the series holds the value for all its images. It may be long, so it is looked through once.
    const TagElement* shared = series.findElement(kVolumeIndex);
    const QVector<int> sharedIndexes = shared != nullptr ? volumeIndexes(*shared) : QVector<int>();
    int left = kMaxVolumeImages;
    for (TagMap* image : series.children()) {
        const TagElement* element = image->findElement(kVolumeIndex);
        if (element == nullptr)
            continue;
        const QVector<int> indexes = element == shared ? sharedIndexes : volumeIndexes(*element);
        left -= indexes.size();
        if (left < 0)
            return false;
        for (const int index : indexes)
            found[index].append(image);
    }
    return true;
}

}  // namespace

void addVolumeIndex(TagMap& image, int index)
{
    const TagElement* held = image.findElement(kVolumeIndex);
    if (held == nullptr) {
        image.putAndInsertInt(kVolumeIndex, index);
    } else if (held->vr() == VrCode::OB) {
        QByteArray indexes = held->value();
        // One from 256 on is cut here. Before it is written,
        // settling notices that other images would be found.
        indexes.append(static_cast<char>(index));
        image.putAndInsertValue(kVolumeIndex, VrCode::OB, indexes);
    }
}

void nameVolumes(TagMap& series)
{
    series.deleteElement(kVolumeIndex);
    // The study may hold the value for all its series.
    if (series.findElement(kVolumeIndex) != nullptr)
        series.markAsMissing(kVolumeIndex);
    for (TagMap* image : series.children())
        image->deleteElement(kVolumeIndex);
    for (const Volume* volume : series.volumes()) {
        for (int i = 0; i < volume->numImages(); ++i)
            addVolumeIndex(*volume->image(i), volume->volumeIndex());
    }
    series.optimize(kVolumeIndex);
}

/// For each volume the images that name it by its position. The indexes have gaps, though, when a volume file
/// gave no volume: as many indexes as there are volumes with slices belong to these one after the other.
bool shareImages(const TagMap& series, const QVector<bool>& haveSlices, QVector<VolumeShare>& shares)
{
    ImagesByVolume images;
    if (!findImages(series, images))
        return false;
    const bool inOrder = haveSlices.count(true) == images.size();
    auto named = images.cbegin();
    for (const bool hasSlices : haveSlices) {
        const int position = shares.size();
        if (!inOrder) {
            shares.append(VolumeShare{position, images.value(position)});
        } else if (hasSlices) {
            shares.append(VolumeShare{named.key(), named.value()});
            ++named;
        } else {
            shares.append(VolumeShare{position, {}});
        }
    }
    return true;
}

}  // namespace Kdd
