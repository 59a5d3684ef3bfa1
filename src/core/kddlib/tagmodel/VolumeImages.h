#pragma once

#include "platform/base/Export.h"

#include <QVector>

namespace Kdd
{

class TagMap;

/// The images of a volume, which belong to the study's tree. Every image knows the lists that name it: one that goes
/// away or leaves its series leaves a gap, at once and in constant time, so that none of the pointers ever dangles.
///
/// A copy names the same images. Used by the thread that uses the tree.
class KDD_EXPORT VolumeImages
{
public:
    VolumeImages() = default;
    VolumeImages(const VolumeImages& other);
    VolumeImages& operator=(const VolumeImages& other);
    ~VolumeImages();

    /// Null where an image has left.
    const QVector<TagMap*>& list() const { return mImages; }

    /// Null stands for an image that has left.
    void set(const QVector<TagMap*>& images);

    bool hasGaps() const { return mHasGaps; }

    /// Moves the images together. For each former place the new one, -1 for a gap.
    QVector<int> closeGaps();

private:
    friend class TagMap;

    void forget(int place);
    void put(int place, TagMap* image) { mImages[place] = image; }
    void release();

    QVector<TagMap*> mImages;
    bool mHasGaps = false;
};

}  // namespace Kdd
