#pragma once

#include <QVector>

namespace Kdd
{

class TagMap;

/// One byte of an image tells this many volumes apart.
constexpr int kVolumesToldApart = 256;

/// Names a volume in one of its images: the index as one byte, further volumes appended as one byte each. An index that
/// needs more than a byte is only kept by an image of no other volume.
void addVolumeIndex(TagMap& image, int index);

/// Makes the images of a series name the volumes that they belong to, and no others.
void nameVolumes(TagMap& series);

/// What the images of a series say of one of its volumes.
struct VolumeShare
{
    int index;
    QVector<TagMap*> images;
};

/// The images of each volume, as the reader of a tag file finds them: its list of volumes names none. `haveSlices` tells
/// of each volume whether it has slices. False when the images name more than there may be.
bool shareImages(const TagMap& series, const QVector<bool>& haveSlices, QVector<VolumeShare>& shares);

}  // namespace Kdd
