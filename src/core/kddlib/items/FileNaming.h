#pragma once

#include <QByteArray>

namespace Kdd
{

// Served DICOM files are named <study directory>/<SOP Instance UID>_<suffix>.dcm, the directory by the Study Instance
// UID. "/" and "\" both separate the parts. The suffix tells several files of one instance apart.

/// The UIDs that such a path names; false, and both empty, when the path is not of this form.
bool extractUIDs(const char* path, QByteArray& sopUID, QByteArray& studyUID);

/// What stands between the last "_" of the file name and ".dcm"; the whole stem when there is no "_", and empty when
/// the path does not end in ".dcm".
QByteArray extractSuffix(const char* path);

}  // namespace Kdd
