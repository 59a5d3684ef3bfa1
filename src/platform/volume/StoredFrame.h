#pragma once

#include "platform/base/Export.h"
#include "platform/base/Result.h"
#include "platform/base/TypedData2D.h"

class DcmItem;

namespace Kdd
{

/// One frame of a DICOM image as it is stored, before any look-up table, rescale or window is applied.
struct StoredFrame
{
    /// How colour is stored once the frame is decoded.
    enum class Colour { Grey, Palette, Rgb, YbrFull };

    TypedData2D pixels;  ///< signed as the pixel representation says, bits above the stored ones removed
    Colour colour = Colour::Grey;
    int reduction = 0;  ///< how often the size was halved while decoding
};

/// Decodes a frame (0-based) of every transfer syntax that can be decoded here; of a file whose values are not in
/// memory no more is read than the frame takes. With `least` above 0 a codec that can may halve the size as long as
/// width and height stay at or above it. The dataset must have the transfer syntax it was read in; it is not changed.
/// May be called on several threads for different datasets.
///
/// Failure: no pixel data, no such frame, sizes that contradict each other, a codec that is not there (the reason names
/// the transfer syntax) or that refuses the data.
KDD_EXPORT Result readStoredFrame(DcmItem& dataset, int frame, int least, StoredFrame& out);

/// Number of Frames, at least 1.
KDD_EXPORT int numberOfFrames(DcmItem& dataset);

}  // namespace Kdd
