#pragma once

#include "platform/base/Result.h"
#include "platform/base/TypedData2D.h"
#include "platform/volume/FrameView.h"
#include "platform/volume/ValueRange.h"

class DcmItem;

namespace Kdd
{

struct StoredFrame;

/// Pixels with the range of values that goes from black to white.
struct ShownPixels
{
    TypedData2D pixels;
    ValueRange range;
};

/// A grey frame (`view.frame`): the modality table or rescale applied, reduced to about the size wanted, with the window
/// that is asked for, else the range of its own one, else its VOI table applied, else the range of its pixels without
/// padding.
ShownPixels showGrey(DcmItem& dataset, const FrameView& view, const StoredFrame& stored);

/// A colour frame as RGB, reduced. Failure: a palette that is missing or damaged.
Result showColour(DcmItem& dataset, const StoredFrame& stored, int width, int height, ShownPixels& shown);

/// Brings pixels that have their range to a size and type that can be shown.
ShownPixels reduce(const ShownPixels& shown, int width, int height);

/// Spreads ranges of only a few steps: what is shown of a value is its distance from the lowest plus half a step, and
/// of few steps that half would be seen. Of a mask of zeros and ones the zeros would be grey.
ShownPixels spreadNarrowRange(const ShownPixels& shown);

}  // namespace Kdd
