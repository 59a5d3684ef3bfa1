#pragma once

#include "kddlib/net/dicom/DepthLimitedStream.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcfilefo.h>

#include <functional>

namespace Kdd
{

/// How a DICOM file is read, in DCMTK's terms.
struct ParseOptions
{
    E_TransferSyntax syntax = EXS_Unknown;
    E_GrpLenEncoding groupLength = EGL_noChange;
    Uint32 maxReadLength = 4096;  // longer values stay where they are, if they can be found again [bytes]
    E_FileReadMode mode = ERM_autoDetect;

    /// Reads from the stream in place of DcmFileFormat::read.
    std::function<OFCondition(DcmInputStream&, Uint32 maxReadLength)> reader = {};
};

/// Fills `file` from a stream, whose own condition counts when it is bad.
OFCondition parseStream(DcmInputStream& stream, DcmFileFormat& file, const ParseOptions& options);

template <typename Stream>
OFCondition parseDicom(DepthLimited<Stream>& stream, DcmFileFormat& file, const ParseOptions& options)
{
    OFCondition condition = parseStream(stream, file, options);
    if (stream.isTooDeep())
        condition = EC_NestedTooDeep;
    return condition;
}

}  // namespace Kdd
