#include "kddlib/tagmodel/VolumeImages.h"

#include "kddlib/tagmodel/TagMap.h"

#include <algorithm>

namespace Kdd
{

VolumeImages::VolumeImages(const VolumeImages& other)
{
    *this = other;
}

VolumeImages& VolumeImages::operator=(const VolumeImages& other)
{
    if (this == &other)
        return *this;
    set(other.mImages);
    return *this;
}

VolumeImages::~VolumeImages()
{
    release();
}

void VolumeImages::set(const QVector<TagMap*>& images)
{
    const QVector<TagMap*> kept =
        images;  // which may be this list, whose images release() has to find unchanged
    release();
    mImages = kept;
    mHasGaps = kept.contains(nullptr);
    for (int i = 0; i < mImages.size(); ++i) {
        if (TagMap* image = kept.at(i))
            image->mVolumePlaces.append({this, i});
    }
}

QVector<int> VolumeImages::closeGaps()
{
    QVector<int> places(mImages.size(), -1);
    QVector<TagMap*> kept;
    kept.reserve(mImages.size());
    for (int i = 0; i < places.size(); ++i) {
        // Its place stays -1, which a slice takes for an unknown image.
        if (mImages.at(i) == nullptr)
            continue;
        places[i] = kept.size();
        kept.append(mImages.at(i));
    }
    set(kept);
    return places;
}

void VolumeImages::forget(int place)
{
    // The place stays, for slices count by it; gaps are closed together, when the images are next asked for.
    mImages[place] = nullptr;
    mHasGaps = true;
}

/// Takes this list out of its images, which may live on without it.
void VolumeImages::release()
{
    for (TagMap* image : qAsConst(mImages)) {
        if (image == nullptr)
            continue;
        QVector<TagMap::VolumePlace>& places = image->mVolumePlaces;
        // An image may be in this list more than once and in those of other volumes, which stay.
        places.erase(std::remove_if(places.begin(), places.end(),
                                    [this](const TagMap::VolumePlace& each) { return each.images == this; }),
                     places.end());
    }
}

}  // namespace Kdd
