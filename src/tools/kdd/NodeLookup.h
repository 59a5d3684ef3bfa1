#pragma once

#include "tools/kdd/Selection.h"

#include <kddlib/TagFile.h>

namespace Kdd
{

/// Reads the study and finds the node that the selection names; null, with the reason logged, when there is none.
/// Owned by `file`.
TagMap* findNode(const NodeSelection& selection, TagFile& file);

/// 0 for a study, 1 for a series, 2 for an image.
int depthOf(const TagMap& node);

/// Where a web service would offer what the node's metadata leaves out.
std::string bulkDataRoot(const TagMap& node);

}  // namespace Kdd
