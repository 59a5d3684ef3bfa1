#pragma once

#include <QString>
#include <QStringList>

namespace Kdd
{

/// The folder of real DICOM files that the environment variable KDD_TEST_DATA names; empty when it is not set. Tests
/// that need them say that they are skipped then.
QString realFilesFolder();

/// All files below a folder of it, sorted.
QStringList realFiles(const char* folder);

}  // namespace Kdd
