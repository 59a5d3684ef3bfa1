#pragma once

#include "support/FileContent.h"

namespace Kdd
{

/// The folder of real DICOM files that the environment variable KDD_TEST_DATA names; empty when it is not set. Tests
/// that need them say that they are skipped then.
inline QString realFilesFolder()
{
    return QString::fromLocal8Bit(qgetenv("KDD_TEST_DATA"));
}

/// All files below a folder of it, sorted.
inline QStringList realFiles(const char* folder)
{
    return filesBelow(realFilesFolder() + QLatin1Char('/') + QLatin1String(folder));
}

}  // namespace Kdd
