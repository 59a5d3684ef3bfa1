#pragma once

#include "server/dicomweb/Resource.h"
#include "server/http/Metrics.h"

#include <memory>
#include <vector>

namespace Kdd
{

/// What resources share; all of it outlives them.
struct ResourceSurroundings
{
    Http::Metrics& metrics;
};

/// All that answers below the prefix of DICOMweb, in the order in which they are asked whether a path is theirs.
std::vector<std::unique_ptr<DicomWeb::Resource>> makeResources(const ResourceSurroundings& surroundings);

}  // namespace Kdd
