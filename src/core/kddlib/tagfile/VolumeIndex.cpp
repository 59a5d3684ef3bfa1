#include "kddlib/tagfile/VolumeIndex.h"

#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"

namespace Kdd
{

void addVolumeIndex(TagMap& image, int index)
{
    const TagElement* held = image.findElement(kVolumeIndex);
    if (held == nullptr) {
        image.putAndInsertInt(kVolumeIndex, index);
    } else if (held->vr() == VrCode::OB) {
        QByteArray indexes = held->value();
        indexes.append(static_cast<char>(index));
        image.putAndInsertValue(kVolumeIndex, VrCode::OB, indexes);
    }
}

}  // namespace Kdd
