#pragma once

#include "platform/base/Export.h"

#include <QtGlobal>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>
#include <dcmtk/dcmdata/dcvr.h>

namespace Kdd
{

/// The value representation of an attribute as tag files store it.
///
/// The numbers are fixed for good. DCMTK renumbers its `DcmEVR` from release to release, so every place that takes a
/// VR from DCMTK or gives one to it goes through `vrCodeOf` and `evrOf`. Any 32-bit number is a valid `VrCode`,
/// because files may hold numbers that this release does not know.
enum class VrCode : quint32 {
    AE = 0,
    AS = 1,
    AT = 2,
    CS = 3,
    DA = 4,
    DS = 5,
    DT = 6,
    FL = 7,
    FD = 8,
    IS = 9,
    LO = 10,
    LT = 11,
    OB = 12,
    OF = 13,
    OW = 14,
    PN = 15,
    SH = 16,
    SL = 17,
    SQ = 18,
    SS = 19,
    ST = 20,
    TM = 21,
    UI = 22,
    UL = 23,
    US = 24,
    UT = 25,
    Ox = 26,       ///< OB or OW
    Xs = 27,       ///< US or SS
    Lt = 28,       ///< look-up table data: US, SS or OW
    Missing = 29,  ///< a marker: absent here although an ancestor has the attribute
    Up = 30,       ///< offset in a DICOMDIR, as UL
    Unknown = 39,
    UN = 40,
    PixelData = 41,
    OverlayData = 42,
    Unknown2B = 43,
    Omitted = 255,  ///< a marker: present in the DICOM data, too long to be kept
};

/// The code under which an attribute of DCMTK's `evr` is stored.
///
/// VRs younger than the numbering keep their bytes under an older one: UC and UR as UT; OD, OL, OV, SV and UV as UN.
/// What DCMTK could not name (unknown and unknown with two length bytes) is UN, so that it is not lost when a dataset
/// is rebuilt; `px`, the dictionary's word for Pixel Data, is ox.
KDD_EXPORT VrCode vrCodeOf(DcmEVR evr);

/// DCMTK's VR of a code; EVR_UNKNOWN for the omitted marker and for numbers that are no code.
KDD_EXPORT DcmEVR evrOf(VrCode code);

/// Whether DCMTK's VRs of values with that code differ, so that `evrOf` is one of several.
KDD_EXPORT bool hasSeveralVrs(VrCode code);

/// The VR that DCMTK's dictionary has for an attribute whose private creator is not known; EVR_UNKNOWN when it has none, as of
/// private ones. To load the dictionary takes as long as some hundred images, so it is asked only where nothing else
/// tells.
KDD_EXPORT DcmEVR dictionaryEvr(const DcmTagKey& key);

/// DCMTK's VR of an attribute whose value is stored under that code: the dictionary's where that agrees with the code, which
/// tells the younger VRs apart, else the code's.
KDD_EXPORT DcmEVR evrOf(VrCode code, const DcmTagKey& key);

/// DCMTK's name of the VR ("PN", "ox", ...), and its name for an unknown one ("??").
KDD_EXPORT const char* vrName(VrCode code);

/// Whether values of the VR are DICOM text.
KDD_EXPORT bool isTextVr(VrCode code);

}  // namespace Kdd
