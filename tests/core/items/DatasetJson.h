#pragma once

#include <string>

namespace Kdd
{

class TagMap;

enum class JsonEntries { Merged, Own };

/// DICOM JSON by way of a DCMTK dataset that is rebuilt from the node, converted as a whole and written by DCMTK. Slow,
/// and what the library's own writer is held against.
std::string datasetJson(const TagMap& map, const std::string& bulkDataRoot, JsonEntries entries);

/// Without what DCMTK does otherwise: reals with other digits, zero without its sign, and lists of nothing but empty values.
std::string comparable(const std::string& json);

}  // namespace Kdd
