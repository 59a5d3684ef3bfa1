#pragma once

#include "platform/base/Export.h"
#include "platform/base/Result.h"
#include "platform/base/TypedData2D.h"

#include <QString>

namespace Kdd
{

/// Bytes of a file or a video, wherever they are. Used by one thread at a time.
class KDD_EXPORT MediaSource
{
public:
    virtual ~MediaSource() = default;
    virtual qint64 size() const = 0;

    /// Up to `length` bytes from `offset` into `out`; how many, 0 at the end, -1 on failure.
    virtual qint64 read(qint64 offset, char* out, qint64 length) = 0;
};

/// Videos. The decoders are in a module of their own that is loaded when the first video is met: they cost every
/// process that links them 40 ms, and their licence binds whoever ships them. May be used on any thread.
class KDD_EXPORT KxCompressedDataMedia
{
public:
    /// Of the duration, where a frame shows what a video is about: its beginning is often black.
    static constexpr double kRepresentative = 0.3;

    /// The frame at `fraction` (0 to 1) of the duration, RGB, scaled down to fit into `width` x `height` with its own
    /// aspect (pixels that are not square are made square); never enlarged. No more is read than finding and decoding
    /// that frame takes. Failure: the module is missing, or nothing in the source can be decoded.
    static Result decodeRepresentativeFrame(MediaSource& source, int width, int height, double fraction,
                                            TypedData2D& frame);

    /// The same for `size` bytes from `offset` of a file; empty, with a warning that names the file, on failure.
    static TypedData2D decodeRepresentativeFrame(const QString& path, qint64 offset, qint64 size, int width,
                                                 int height, double fraction);
};

}  // namespace Kdd
