#pragma once

#include "platform/base/Export.h"

#include <iosfwd>
#include <string>

namespace Kdd
{

class TagMap;

/// Writes the merged view of a node as one object of the DICOM JSON model, in UTF-8 and without the system's own
/// group 0006.
///
/// A value that the cache does not keep is written as {"vr": ..., "BulkDataURI": ...}; the address is `bulkDataRoot`,
/// "/" and the keys that lead to the value, with the 0-based item index after that of each sequence
/// ("root/00409096/0/00281051"). Texts that their character set cannot explain are decoded as `decodeText` does.
KDD_EXPORT void writeDicomJson(std::ostream& out, const TagMap& map, const std::string& bulkDataRoot);

/// The same of the node's own entries only, and in sequences of the items' own. Markers that hide an inherited value
/// have no form in JSON and are left out; texts are decoded by the character set that the node shows, also where it
/// inherits that.
KDD_EXPORT void writeOwnDicomJson(std::ostream& out, const TagMap& map, const std::string& bulkDataRoot);

}  // namespace Kdd
