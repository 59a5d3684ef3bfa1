#pragma once

#include <string>

namespace Kdd
{

class TagMap;

enum class JsonEntries { Merged, Own };

/// DICOM JSON by way of a DCMTK dataset that is rebuilt from the node, converted as a whole and written by DCMTK. Slow,
/// and what the library's own writer is held against.
std::string datasetJson(const TagMap& map, const std::string& bulkDataRoot, JsonEntries entries);

/// With the numbers of VR FD to 10 digits and zero without its sign, as certain as DCMTK gives them.
std::string withRoundedReals(const std::string& json);

}  // namespace Kdd
