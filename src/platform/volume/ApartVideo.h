#pragma once

#include "platform/base/Result.h"
#include "platform/base/TypedData2D.h"
#include "platform/decoder/DecoderChannel.h"

namespace Kdd
{

class DecoderPool;
class MediaSource;

/// Which frame of a video is wanted, and within which size.
struct VideoPlace
{
    int width = 0;        ///< [pixels], above 0
    int height = 0;       ///< likewise
    double fraction = 0;  ///< of the duration, 0 to 1
};

/// Decodes a frame as decodeVideoInside does, with the same result, in a decoder of `pool`, which gets the bytes of
/// `source` that it asks for.
Result decodeVideoApart(DecoderPool& pool, MediaSource& source, const VideoPlace& place, TypedData2D& frame);

/// Decodes a frame by the video module in this process.
Result decodeVideoInside(MediaSource& source, const VideoPlace& place, TypedData2D& frame);

/// Loads the video module; failure names it when it is missing.
Result loadVideoModule();

/// What the decoder does with the question and says to it; it asks for bytes by `channel`.
DecoderMessage answerVideo(const DecoderChannel& channel, const DecoderMessage& question);

}  // namespace Kdd
