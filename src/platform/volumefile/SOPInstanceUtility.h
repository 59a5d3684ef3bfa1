#pragma once

#include "platform/base/Export.h"

#include <string>
#include <vector>

namespace Kdd
{

class ParamBundle;

/// The images that a volume file was made from, kept in its bundle "SOPInstanceUIDs": one text for each slice, a SOP
/// Instance UID, or for frames of a multi-frame image the UID, "." and the frame number. May be used on any thread.
class KDD_EXPORT SOPInstanceUtility
{
public:
    static std::vector<std::string> sopUIDList(const ParamBundle& sopInstanceUIDs);
    static ParamBundle bundleOf(const std::vector<std::string>& sopUIDs);
};

}  // namespace Kdd
