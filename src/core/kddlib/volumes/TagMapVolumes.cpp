#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"
#include "kddlib/volumes/VolumeImages.h"

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

void TagMap::leaveVolumes()
{
    for (const VolumePlace& each : qAsConst(mVolumePlaces))
        each.images->forget(each.place);
    mVolumePlaces.clear();
}

void TagMap::takeVolumePlaces(TagMap& former)
{
    for (const VolumePlace& each : qAsConst(former.mVolumePlaces)) {
        each.images->put(each.place, this);
        mVolumePlaces.append(each);
    }
    former.mVolumePlaces.clear();
}

void TagMap::forgetVolumeSuffixes()
{
    for (Volume* volume : qAsConst(mVolumes))
        volume->setFileNameSuffix(QByteArray());
}

}  // namespace Kdd
