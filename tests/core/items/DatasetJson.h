#pragma once

#include <iosfwd>
#include <string>

namespace Kdd
{

class TagMap;

// DICOM JSON by way of a DCMTK dataset that is rebuilt from the node, converted as a whole and written by DCMTK. Slow,
// and what the library's own writer is held against.

void writeDatasetJson(std::ostream& out, const TagMap& map, const std::string& bulkDataRoot);
void writeOwnDatasetJson(std::ostream& out, const TagMap& map, const std::string& bulkDataRoot);

}  // namespace Kdd
