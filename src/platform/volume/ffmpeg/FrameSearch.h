#pragma once

#include "platform/volume/ffmpeg/AvHandles.h"

#include <string>

namespace Kdd
{

class MediaInput;

/// Finds one frame of a video and decodes it.
///
/// A place in the video is a time where the container has a duration, else an offset in bytes: raw streams carry no
/// times, and their bytes tell about as much. Frames depend on those before them back to a key frame, so the search
/// begins at a key frame before the wanted place and decodes up to it. How far it goes back, and how much it decodes,
/// is bounded.
class FrameSearch
{
public:
    /// `input` is open and outlives the object.
    explicit FrameSearch(const MediaInput& input);

    /// The first frame at or after `fraction` (0 to 1) of the video that can be decoded with all that it depends on; a
    /// video without one gives the nearest frame before, or else whatever frame comes first. An empty text, or why
    /// there is none.
    std::string find(double fraction);

    /// What was found; owned by the search.
    const AVFrame& frame() const { return *mFound; }

private:
    enum class Begin { KeyBeforePlace, AnyKey, AnyPacket };
    enum class Step { More, End, Found };

    bool openDecoder();
    bool decodeFrom(int64_t start, Begin begin);
    bool seek(int64_t start);
    bool mayBegin(Begin begin) const;
    void notePlace();
    Step feed(const AVPacket* packet);
    Step take();

    const MediaInput& mInput;
    AvHandle<AVCodecContext> mDecoder;
    AvHandle<AVPacket> mPacket;
    AvHandle<AVFrame> mFrame;
    AvHandle<AVFrame> mFound;
    const bool mByTime;
    int64_t mWanted = 0;  // place
    int64_t mPlace = 0;   // of the last packet
    int mPacketsLeft;
    int64_t mPixelsLeft;
};

}  // namespace Kdd
