#include "platform/volume/ffmpeg/MediaInput.h"

#include "platform/volume/ffmpeg/VideoModule.h"

#include <algorithm>
#include <array>
#include <limits>

namespace Kdd
{
namespace
{

constexpr int kBufferSize = 32 * 1024;

// Enough for many seconds of the highest bit rates; a video whose indexes lead in circles ends here.
constexpr int64_t kMaxBytesRead = int64_t{256} * 1024 * 1024;

// What is read to learn which streams there are.
constexpr int64_t kProbeSize = 1024 * 1024;

// Times are claims as well; beyond this their sums would not fit.
constexpr int64_t kMaxTime = std::numeric_limits<int64_t>::max() / 4;

// Elementary, program and transport streams, and the ISO base media file: what DICOM's transfer syntaxes allow.
constexpr char kFormats[] = "mpegvideo,mpeg,mpegts,h264,hevc,mov";

constexpr AVCodecID kCodecs[] = {AV_CODEC_ID_MPEG1VIDEO, AV_CODEC_ID_MPEG2VIDEO, AV_CODEC_ID_H264,
                                 AV_CODEC_ID_HEVC};

// What a hospital's video points to is none of a preview's business, be it a file or an address.
int refuseToOpen(AVFormatContext* /*format*/, AVIOContext** /*io*/, const char* /*url*/, int /*flags*/,
                 AVDictionary** /*options*/)
{
    return AVERROR(EPERM);
}

bool isVideo(const AVStream& stream)
{
    return std::find(std::begin(kCodecs), std::end(kCodecs), stream.codecpar->codec_id) != std::end(kCodecs);
}

std::string reasonOf(const char* action, int error)
{
    std::array<char, AV_ERROR_MAX_STRING_SIZE> text = {};
    av_strerror(error, text.data(), text.size());
    return std::string(action) + ": " + text.data();
}

}  // namespace

MediaInput::MediaInput(const VideoRequest& request)
    : mRequest(request)
    , mBytesLeft(kMaxBytesRead)
{
}

int MediaInput::readBytes(void* self, uint8_t* out, int length)
{
    auto& input = *static_cast<MediaInput*>(self);
    const int64_t wanted = std::min<int64_t>(length, input.mRequest.size - input.mPosition);
    if (wanted <= 0)
        return AVERROR_EOF;
    // All reads count, because seeking back reads the same bytes again.
    if (wanted > input.mBytesLeft)
        return AVERROR(EIO);
    const int64_t got = input.mRequest.read(input.mRequest.source, input.mPosition, out, wanted);
    // More than was asked for would be beyond the room that there is.
    if (got <= 0 || got > wanted)
        return got == 0 ? AVERROR_EOF : AVERROR(EIO);
    input.mPosition += got;
    input.mBytesLeft -= got;
    return static_cast<int>(got);
}

int64_t MediaInput::seekBytes(void* self, int64_t offset, int whence)
{
    auto& input = *static_cast<MediaInput*>(self);
    if ((whence & AVSEEK_SIZE) != 0)
        return input.mRequest.size;
    // The library turns the other origins into this one.
    if ((whence & ~AVSEEK_FORCE) != SEEK_SET || offset < 0)
        return AVERROR(EINVAL);
    input.mPosition = offset;
    return offset;
}

bool MediaInput::prepare()
{
    auto* buffer = static_cast<unsigned char*>(av_malloc(kBufferSize));
    if (buffer == nullptr)
        return false;
    mBytes.reset(avio_alloc_context(buffer, kBufferSize, 0, this, &readBytes, nullptr, &seekBytes));
    // Nobody owns the buffer yet.
    if (mBytes == nullptr) {
        av_free(buffer);
        return false;
    }
    mFormat.reset(avformat_alloc_context());
    if (mFormat == nullptr)
        return false;
    mFormat->pb = mBytes.get();
    mFormat->io_open = &refuseToOpen;
    mFormat->probesize = kProbeSize;
    mFormat->format_probesize = static_cast<int>(kProbeSize);
    mFormat->format_whitelist = av_strdup(kFormats);
    // The search for streams would decode with limits of its own; parsing alone tells it enough.
    mFormat->codec_whitelist = av_strdup("none");
    return mFormat->format_whitelist != nullptr && mFormat->codec_whitelist != nullptr;
}

std::string MediaInput::open()
{
    if (!prepare())
        return "out of memory";
    // On failure it frees the container itself.
    AVFormatContext* format = mFormat.release();
    int error = avformat_open_input(&format, nullptr, nullptr, nullptr);
    mFormat.reset(format);
    if (error < 0)
        return reasonOf("no known video format", error);
    error = avformat_find_stream_info(mFormat.get(), nullptr);
    if (error < 0)
        return reasonOf("no streams", error);
    return findStream() ? std::string() : "no video stream of a known codec";
}

bool MediaInput::findStream()
{
    bool found = false;
    for (unsigned i = 0; i < mFormat->nb_streams; ++i) {
        AVStream& candidate = *mFormat->streams[i];
        if (!found && isVideo(candidate)) {
            mStream = i;
            found = true;
        } else {
            // Its packets are dropped before they cost anything.
            candidate.discard = AVDISCARD_ALL;
        }
    }
    return found;
}

int64_t MediaInput::size() const
{
    return mRequest.size;
}

bool MediaInput::next(AVPacket& packet) const
{
    for (;;) {
        av_packet_unref(&packet);
        if (av_read_frame(mFormat.get(), &packet) < 0)
            return false;
        if (packet.stream_index == static_cast<int>(mStream))
            return true;
    }
}

bool MediaInput::seekToTime(int64_t time) const
{
    return av_seek_frame(mFormat.get(), static_cast<int>(mStream), time, AVSEEK_FLAG_BACKWARD) >= 0;
}

bool MediaInput::seekToByte(int64_t position) const
{
    return av_seek_frame(mFormat.get(), -1, position, AVSEEK_FLAG_BYTE) >= 0;
}

bool MediaInput::hasDuration() const
{
    const int64_t start = stream().start_time == AV_NOPTS_VALUE ? 0 : stream().start_time;
    return stream().duration > 0 && stream().duration < kMaxTime && start > -kMaxTime && start < kMaxTime &&
           mFormat->duration_estimation_method != AVFMT_DURATION_FROM_BITRATE;
}

}  // namespace Kdd
