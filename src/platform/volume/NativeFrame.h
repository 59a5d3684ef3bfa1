#pragma once

#include "platform/base/Result.h"
#include "platform/volume/StoredFrame.h"

#include <QByteArray>

class DcmElement;

namespace Kdd
{

struct FrameLayout;

/// Reads one frame of pixel data that is not compressed. Of an element whose value is still in its file no more is read
/// than the frame.
Result readNativeFrame(DcmElement& pixelData, const FrameLayout& layout, int frame, StoredFrame& out);

/// What an uncompressed frame takes [bits]; less than its decoded pixels where chroma is shared between two pixels.
qint64 nativeFrameBits(const FrameLayout& layout, bool sharesChroma);

/// Whether uncompressed frames of `length` bytes in all share chroma between two pixels. Some writers declare that but
/// store all of it; the length tells.
bool sharesChroma(const FrameLayout& layout, qint64 length);

/// The pixels in the bytes of an uncompressed frame, beginning `firstBit` (0 to 7, of single-bit pixels only) bits
/// after the first byte. `bytes` are in the machine's order and hold the whole frame.
TypedData2D unpackFrame(const QByteArray& bytes, const FrameLayout& layout, int firstBit, bool sharesChroma);

/// Removes what does not belong to the value: bits above `highBit` and below the `stored` ones, and extends the sign.
void keepStoredBits(TypedData2D& pixels, int stored, int highBit);

}  // namespace Kdd
