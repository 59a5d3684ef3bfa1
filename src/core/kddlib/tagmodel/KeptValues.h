#pragma once

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>

namespace Kdd
{

// Which of a dataset's attributes a node takes, and how long their values may be.

/// Curve Data (50xx,3000) and Overlay Data (60xx,3000) have sixteen
/// groups each, from `first` on in steps of two.
inline bool isRepeatingGroup(const DcmTagKey& key, Uint16 first)
{
    return key.getGroup() >= first && key.getGroup() <= first + 0x1e && key.getElement() == 0x3000;
}

/// What a file brings under our own keys is not ours: it would pass for the image's path, volume or preview.
inline bool isOwnAttribute(const DcmTagKey& key)
{
    return key.getGroup() == 0x0006 && (key.getElement() & 0xff00) == 0x7100;
}

/// Attributes that viewers need whole whatever their length.
inline bool hasLargeBound(const DcmTagKey& key)
{
    const int low = key.getElement() & 0xff;
    switch (key.getGroup()) {
    case 0x0018:
        return key == DCM_FrameTimeVector;
    case 0x0029:
        return low == 0x00;
    case 0x0070:
        return key == DCM_GraphicData;
    case 0x0071:
        // 21 is our audit log, which the next correction continues.
        return low == 0x21 || low == 0x62 || low == 0x64;
    default:
        return isRepeatingGroup(key, 0x5000) || isRepeatingGroup(key, 0x6000);
    }
}

/// The table is a value of an item, so the larger bound has to go down into the items.
inline bool isLookupTableSequence(const DcmTagKey& key)
{
    return key == DCM_VOILUTSequence || key == DCM_PresentationLUTSequence;
}

}  // namespace Kdd
