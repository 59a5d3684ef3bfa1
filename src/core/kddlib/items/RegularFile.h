#pragma once

#include "platform/base/Export.h"
#include "platform/base/Result.h"

#include <QByteArray>

namespace Kdd
{

/// A DICOM file of any form that the library reads, local or behind a URL, as the bytes of one with preamble and meta
/// header, in little endian and not deflated as a whole. Compressed pixels stay as they are.
///
/// Fails when the file cannot be read, and for one that takes more than 512 MiB in either form: all of it is in memory.
KDD_EXPORT Result readAsRegularFile(const QByteArray& path, QByteArray& bytes);

}  // namespace Kdd
