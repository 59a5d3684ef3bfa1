#pragma once

#include "platform/base/Export.h"
#include "platform/database/Catalogue.h"

#include <QString>

namespace Kdd
{

class TagFile;
class TagMap;

// What the image database keeps of studies and images, read from their tag maps.

/// What it keeps of a file, from the image that the file holds.
KDD_EXPORT Kxg::DicomFileRecord fileRecord(const TagMap& image, const QByteArray& path,
                                           const Kxg::FileStamp& stamp);

/// What it keeps of a study whose tag file was written: by what that is recognised, and what each series shows of
/// itself. A series is described by its first image by path, the study by the first of all.
KDD_EXPORT Kxg::BuiltStudy builtStudy(const TagFile& file);

/// Whether the tag file at the path is the one of that stamp. False when it is absent, was written by others since, or
/// when a write of it did not come to its end.
KDD_EXPORT bool isTagFile(const QString& path, const Kxg::TagFileStamp& stamp);

}  // namespace Kdd
