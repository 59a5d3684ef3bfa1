#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"

namespace Kdd
{

void TagMap::addBareVolume(Volume* volume)
{
    if (mVolumes.contains(volume))
        return;
    mVolumes.append(volume);
    if (volume->mVolumeIndex < 0)
        volume->mVolumeIndex = mVolumes.size();
}

void TagMap::clearVolumes()
{
    if (mOwns)
        qDeleteAll(mVolumes);
    mVolumes.clear();
}

/// Volumes point to the images of their series without owning them.
void TagMap::forgetInVolumes(const TagMap* image)
{
    for (Volume* volume : qAsConst(mVolumes))
        volume->forgetImage(image);
}

void TagMap::forgetVolumeSuffixes()
{
    for (Volume* volume : qAsConst(mVolumes))
        volume->setFileNameSuffix(QByteArray());
}

}  // namespace Kdd
