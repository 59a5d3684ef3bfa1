#pragma once

#include "platform/volume/ffmpeg/AvHandles.h"

#include <string>

namespace Kdd
{

struct VideoRequest;

/// A video opened: its container is understood and its video stream found. Only the formats of DICOM videos are
/// opened, nothing that the video refers to outside itself is, and no more than `kMaxBytesRead` is ever read.
class MediaInput
{
public:
    /// `request` has to outlive the object.
    explicit MediaInput(const VideoRequest& request);

    /// An empty text, or why there is nothing to decode. To be called once, first.
    std::string open();

    AVStream& stream() const { return *mFormat->streams[mStream]; }

    /// Of the source [bytes].
    int64_t size() const;

    /// The next packet of the video stream; false at the end.
    bool next(AVPacket& packet) const;

    /// Continues before a time [time base of the stream], or at a place [bytes].
    bool seekToTime(int64_t time) const;
    bool seekToByte(int64_t position) const;

    /// Whether times can be trusted: a duration that was only guessed from a claimed bit rate is none.
    bool hasDuration() const;

private:
    static int readBytes(void* self, uint8_t* out, int length);
    static int64_t seekBytes(void* self, int64_t offset, int whence);
    bool prepare();
    bool findStream();

    const VideoRequest& mRequest;
    int64_t mPosition = 0;
    int64_t mBytesLeft;
    unsigned mStream = 0;
    // The container is closed before the bytes that it comes from.
    AvHandle<AVIOContext> mBytes;
    AvHandle<AVFormatContext> mFormat;
};

}  // namespace Kdd
