#pragma once

#include <QByteArray>

namespace Kdd
{

// Served DICOM files are named <study directory>/<SOP Instance UID>_<suffix>.dcm, the directory by the Study Instance
// UID. "/" and "\" both separate the parts. The suffix tells several files of one instance apart.

/// The UIDs that such a path names: what stands before its last "_" up to the folder, and the folder's name. False, and
/// both empty, when the path does not end in ".dcm" or names no folder. Memory that they have is used again.
bool extractUIDs(const char* path, QByteArray& sopUID, QByteArray& studyUID);

/// What stands between the last "_" of the file name and ".dcm"; the whole stem when there is no "_", and empty when
/// the path does not end in ".dcm".
QByteArray extractSuffix(const char* path);

/// The same into memory that `suffix` may have already.
void extractSuffix(const char* path, QByteArray& suffix);

}  // namespace Kdd
