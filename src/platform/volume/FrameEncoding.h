#pragma once

#include "platform/base/Result.h"

#include <QByteArray>

namespace Kdd
{

struct FrameLayout;

/// How frames are compressed here. All of it is without loss.
enum class FrameCoding {
    JpegLossless,  ///< process 14 with the first selection value
    JpegLs,
    Rle,
};

/// What of a frame's kind can be compressed that way: numbers of 8 or 16 bits, by RLE also of 1 and 32, in colours that
/// come out again as they went in.
bool canEncode(FrameCoding coding, const FrameLayout& layout);

/// Compresses a frame into an even number of bytes. `pixels` are as an uncompressed dataset in little endian holds them,
/// samples side by side, chroma not shared, single bits packed; every bit of them comes out again, those that do not
/// belong to the value too. May be called on several threads.
Result encodeFrame(FrameCoding coding, const QByteArray& pixels, const FrameLayout& layout,
                   QByteArray& bytes);

}  // namespace Kdd
