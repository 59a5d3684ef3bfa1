#pragma once

#include "platform/base/Export.h"

#include <QByteArray>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/ofstd/ofcond.h>

class DcmFileFormat;

namespace Kdd
{

/// Loads a DICOM file with or without preamble and meta header; the transfer syntax is recognised, values longer than
/// 4096 bytes stay in the file until they are asked for.
///
/// As DCMTK's own loading, but an input whose sequences nest deeper than `kMaxItemDepth` items is refused while it is
/// read ("Sequence items are nested too deep"): DCMTK recurses once for each level and would end the process.
KDD_EXPORT OFCondition readDicomFile(const char* path, DcmFileFormat& file);

/// The same from the bytes of a file, or from its beginning if that ends between two attributes. The bytes need not
/// outlive the call.
KDD_EXPORT OFCondition readDicomBuffer(const QByteArray& bytes, DcmFileFormat& file);

}  // namespace Kdd
