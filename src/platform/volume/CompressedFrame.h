#pragma once

#include "platform/base/Result.h"
#include "platform/volume/StoredFrame.h"

#include <QByteArray>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcxfer.h>

namespace Kdd
{

struct FrameLayout;

/// Decodes the compressed bytes of a frame. `xfer` is consulted only where they do not show themselves what they are;
/// it is EXS_Unknown, or one without compression, when the library that read the dataset does not know the syntax.
///
/// JPEG in all its forms, which libraries of others decode, is decoded apart where decoderPlace() says so.
Result decodeFrame(const QByteArray& bytes, E_TransferSyntax xfer, const FrameLayout& layout, int least,
                   StoredFrame& out);

/// Decodes JPEG, JPEG-LS or JPEG 2000, which these bytes have to be, in this process.
Result decodeCodestream(const QByteArray& bytes, const FrameLayout& layout, int least, StoredFrame& out);

/// MPEG-2, H.264 or HEVC: a stream whose frames cannot be told apart without decoding it.
bool isVideo(E_TransferSyntax xfer);

/// The decoders behind it, one for each family.
Result decodeJpeg(const QByteArray& bytes, const FrameLayout& layout, StoredFrame& out);
Result decodeJpeg2000(const QByteArray& bytes, const FrameLayout& layout, int least, StoredFrame& out);
Result decodeRle(const QByteArray& bytes, const FrameLayout& layout, StoredFrame& out);
Result decodeDeflated(const QByteArray& bytes, const FrameLayout& layout, StoredFrame& out);

/// Whether a codestream of this size belongs to the layout; if not, the failure.
Result checkCodestream(const FrameLayout& layout, qint64 columns, qint64 rows, qint64 samples, int precision);

}  // namespace Kdd
