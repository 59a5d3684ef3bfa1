#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/VolumeImages.h"

namespace Kdd
{

const QList<Volume*>& TagMap::volumes() const
{
    static const QList<Volume*> none;
    return mVolumes != nullptr ? mVolumes->list() : none;
}

void TagMap::clearVolumes()
{
    mVolumes.reset();
}

/// At once, because a volume is asked for its images long after one of them has gone.
void TagMap::leaveVolumes()
{
    for (const VolumePlace& each : qAsConst(mVolumePlaces))
        each.images->forget(each.place);
    mVolumePlaces.clear();
}

/// The lists keep their places; only the image that stands in each is another one.
void TagMap::takeVolumePlaces(TagMap& former)
{
    for (const VolumePlace& each : qAsConst(former.mVolumePlaces)) {
        each.images->put(each.place, this);
        mVolumePlaces.append(each);
    }
    former.mVolumePlaces.clear();
}

}  // namespace Kdd
