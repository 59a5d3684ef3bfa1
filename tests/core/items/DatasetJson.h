#pragma once

#include <string>

namespace Kdd
{

class TagMap;

enum class JsonEntries { Merged, Own };

/// DICOM JSON by way of a DCMTK dataset that is rebuilt from the node, converted as a whole and written by DCMTK. Slow,
/// and what the library's own writer is held against.
std::string datasetJson(const TagMap& map, const std::string& bulkDataRoot, JsonEntries entries);

}  // namespace Kdd
