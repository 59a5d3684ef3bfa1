#pragma once

#include "platform/base/Result.h"
#include "platform/base/TypedData2D.h"

#include <QByteArray>

class DcmItem;

namespace Kdd
{

/// How a dataset says that its frames are laid out. What `readFrameLayout` accepts is consistent: sizes are positive, a
/// frame takes at most `kMaxFrameBytes`, the stored bits lie within the allocated ones.
struct FrameLayout
{
    int rows = 0;
    int columns = 0;
    int samples = 1;  ///< numbers per pixel, 1 or 3
    int frames = 1;
    int bitsAllocated = 8;  ///< 1, 8, 16 or 32; of floating-point pixels 32 or 64
    int bitsStored = 8;
    int highBit = 7;
    bool isSigned = false;
    bool isFloat = false;
    bool isPlanar = false;
    bool isBigEndian = false;  ///< of the file that the dataset was read from
    QByteArray photometric;    ///< such as MONOCHROME2

    /// What a decoded number is; a single bit becomes a whole byte.
    PrimitiveType type() const;

    qint64 numValues() const { return qint64(rows) * columns * samples; }

    /// Of a decoded frame [bytes].
    qint64 frameBytes() const { return numValues() * sizeOf(type()); }

    /// Pixels of the size and type of a frame, not set.
    TypedData2D allocate() const;
};

/// Of a decoded frame [bytes]: a mammogram takes some 30 MB, a claim of more than this is no picture.
constexpr qint64 kMaxFrameBytes = qint64(1) << 30;

Result readFrameLayout(DcmItem& dataset, FrameLayout& layout);

}  // namespace Kdd
