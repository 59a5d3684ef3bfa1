#include "kddlib/tagmodel/VrCode.h"

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dctag.h>

#include <array>
#include <iterator>

namespace Kdd
{

namespace
{

/// DCMTK's VRs by code, 0 to 43. The enumeration's names are stable, its numbers are not.
constexpr DcmEVR kEvrByCode[] = {
    EVR_AE,          EVR_AS,        EVR_AT,      EVR_CS,        EVR_DA,       EVR_DS,      EVR_DT,
    EVR_FL,          EVR_FD,        EVR_IS,      EVR_LO,        EVR_LT,       EVR_OB,      EVR_OF,
    EVR_OW,          EVR_PN,        EVR_SH,      EVR_SL,        EVR_SQ,       EVR_SS,      EVR_ST,
    EVR_TM,          EVR_UI,        EVR_UL,      EVR_US,        EVR_UT,       EVR_ox,      EVR_xs,
    EVR_lt,          EVR_na,        EVR_up,      EVR_item,      EVR_metainfo, EVR_dataset, EVR_fileFormat,
    EVR_dicomDir,    EVR_dirRecord, EVR_pixelSQ, EVR_pixelItem, EVR_UNKNOWN,  EVR_UN,      EVR_PixelData,
    EVR_OverlayData, EVR_UNKNOWN2B};

static_assert(std::size(kEvrByCode) == 44, "one entry for each code");
static_assert(EVR_OB == 12 && EVR_UNKNOWN2B == 51,
              "DCMTK's numbering has changed: look for VRs without a code");

// More than DCMTK has, and what its enumeration can hold: a release
// with a few more VRs stays inside the table.
constexpr std::size_t kEvrNumbers = 64;

/// Codes by DCMTK's number. What has no code of its own keeps its bytes under another one.
std::array<VrCode, kEvrNumbers> codesByEvr()
{
    std::array<VrCode, kEvrNumbers> table{};
    // A VR that has no code yet keeps its bytes as UN.
    table.fill(VrCode::UN);
    for (std::size_t code = 0; code < std::size(kEvrByCode); ++code)
        table[kEvrByCode[code]] = static_cast<VrCode>(code);
    table[EVR_UC] = VrCode::UT;
    table[EVR_UR] = VrCode::UT;
    table[EVR_px] = VrCode::Ox;
    table[EVR_UNKNOWN] = VrCode::UN;
    table[EVR_UNKNOWN2B] = VrCode::UN;
    return table;
}

}  // namespace

VrCode vrCodeOf(DcmEVR evr)
{
    static const std::array<VrCode, kEvrNumbers> table = codesByEvr();
    const auto number = static_cast<std::size_t>(evr);
    return number < table.size() ? table[number] : VrCode::UN;
}

DcmEVR evrOf(VrCode code)
{
    const auto number = static_cast<quint32>(code);
    return number < std::size(kEvrByCode) ? kEvrByCode[number] : EVR_UNKNOWN;
}

bool hasSeveralVrs(VrCode code)
{
    return code == VrCode::UT || code == VrCode::Ox || code == VrCode::UN;
}

DcmEVR dictionaryEvr(const DcmTagKey& key)
{
    if (key == DCM_PixelData)
        return EVR_px;
    // Of these it knows by themselves no more than how long their group is, and their creators.
    if (key.getGroup() % 2 != 0 && key.getElement() > 0xff)
        return EVR_UNKNOWN;
    return DcmTag(key).getEVR();
}

DcmEVR evrOf(VrCode code, const DcmTagKey& key)
{
    const DcmEVR known = hasSeveralVrs(code) ? dictionaryEvr(key) : EVR_UNKNOWN;
    return known != EVR_UNKNOWN && vrCodeOf(known) == code ? known : evrOf(code);
}

const char* vrName(VrCode code)
{
    // DcmVR knows the names of static storage only, so the pointer outlives the object.
    return DcmVR(evrOf(code)).getVRName();
}

bool isTextVr(VrCode code)
{
    switch (code) {
    case VrCode::AE:
    case VrCode::AS:
    case VrCode::CS:
    case VrCode::DA:
    case VrCode::DS:
    case VrCode::DT:
    case VrCode::IS:
    case VrCode::LO:
    case VrCode::LT:
    case VrCode::PN:
    case VrCode::SH:
    case VrCode::ST:
    case VrCode::TM:
    case VrCode::UI:
    case VrCode::UT:
        return true;
    default:
        return false;
    }
}

}  // namespace Kdd
