#pragma once

#include "server/dicomweb/Resource.h"

#include <memory>
#include <vector>

namespace Kdd
{

/// All that answers below the prefix of DICOMweb, in the order in which they are asked whether a path is theirs.
std::vector<std::unique_ptr<DicomWeb::Resource>> makeResources();

}  // namespace Kdd
