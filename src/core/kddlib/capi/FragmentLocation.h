#pragma once

#include <QtGlobal>

class DcmFileFormat;

namespace Kdd
{

/// Where in a file the first fragment of its encapsulated pixel data lies.
struct FragmentLocation
{
    qint64 offset = 0;  ///< of its first byte [bytes]
    qint64 length = 0;  ///< [bytes]
    bool isOnly = false;
};

/// Finds it for a DICOM file that has been read from `path` into `file`. False when the pixel data are not encapsulated
/// or have no fragment, or when the file is not the one that was read any more.
bool locateFirstFragment(const char* path, DcmFileFormat& file, FragmentLocation& location);

}  // namespace Kdd
