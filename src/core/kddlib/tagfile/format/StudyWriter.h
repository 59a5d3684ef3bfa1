#pragma once

#include "kddlib/tagfile/TagFileSettings.h"
#include "kddlib/tagfile/format/FileSizes.h"
#include "platform/base/Result.h"

class QDataStream;

namespace Kdd
{

class StudyTree;

/// Writes the tree as a tag file. Before that its volumes are settled: those that lost all their images go, the others
/// are numbered as the reader needs it. On failure nothing is written; the tree then holds what its reader would refuse
/// or lose, or cannot be compressed.
Result writeStudy(StudyTree& tree, TagFileSettings::CompressionMode mode, QDataStream& out, FileSizes& sizes);

}  // namespace Kdd
