#include "platform/volume/ffmpeg/FrameSearch.h"

#include "platform/volume/ffmpeg/MediaInput.h"

#include <algorithm>

namespace Kdd
{
namespace
{

// Twice the height and width of the largest pictures that video codecs in medicine have levels for.
constexpr int64_t kMaxPixels = int64_t{8192} * 8192;

// Bounds on the work, over all attempts: half a minute of video at 60 frames a second, or 2000 frames of 1920 x 1080.
constexpr int kMaxPackets = 2000;
constexpr int64_t kMaxPixelsDecoded = int64_t{4} * 1024 * 1024 * 1024;

// How far before the wanted place an attempt begins: in units of two seconds, or of the bytes that two seconds take at
// a usual bit rate.
constexpr int64_t kUnitSeconds = 2;
constexpr int64_t kUnitBytes = 1024 * 1024;
constexpr int kMaxUnitsBack = 8;

}  // namespace

FrameSearch::FrameSearch(const MediaInput& input)
    : mInput(input)
    , mPacket(av_packet_alloc())
    , mFrame(av_frame_alloc())
    , mFound(av_frame_alloc())
    , mByTime(input.hasDuration())
    , mPacketsLeft(kMaxPackets)
    , mPixelsLeft(kMaxPixelsDecoded)
{
}

bool FrameSearch::openDecoder()
{
    const AVCodecParameters* parameters = mInput.stream().codecpar;
    const AVCodec* codec = avcodec_find_decoder(parameters->codec_id);
    mDecoder.reset(codec == nullptr ? nullptr : avcodec_alloc_context3(codec));
    if (mDecoder == nullptr || avcodec_parameters_to_context(mDecoder.get(), parameters) < 0)
        return false;
    mDecoder->thread_count = 1;
    mDecoder->max_pixels = kMaxPixels;
    mDecoder->pkt_timebase = mInput.stream().time_base;
    return avcodec_open2(mDecoder.get(), codec, nullptr) >= 0;
}

std::string FrameSearch::find(double fraction)
{
    if (mPacket == nullptr || mFrame == nullptr || mFound == nullptr || !openDecoder())
        return "its decoder cannot be started";
    const AVStream& stream = mInput.stream();
    const int64_t first = mByTime && stream.start_time != AV_NOPTS_VALUE ? stream.start_time : 0;
    const int64_t length = mByTime ? stream.duration : mInput.size();
    mWanted = first + static_cast<int64_t>(static_cast<double>(length) * fraction);
    const int64_t unit =
        mByTime ? av_rescale_q(kUnitSeconds, AVRational{1, 1}, stream.time_base) : kUnitBytes;

    // Near first: an index leads to the right key frame at once, and without one the first key frame that comes is
    // then seldom further away than twice what is needed.
    bool found = false;
    for (int units = 0; !found && units <= kMaxUnitsBack; units = std::max(1, units * 2))
        found = decodeFrom(mWanted - units * unit, Begin::KeyBeforePlace);
    // The next key frame after the place is closer than the beginning of the video. That is sought before its time,
    // since a frame is decoded before it is shown.
    found = found || decodeFrom(mWanted, Begin::AnyKey) || decodeFrom(first - unit, Begin::AnyPacket);
    return found ? std::string() : "no frame can be decoded";
}

bool FrameSearch::seek(int64_t start)
{
    // What the decoder still holds would come out as frames of this attempt.
    avcodec_flush_buffers(mDecoder.get());
    av_frame_unref(mFound.get());
    mPlace = mByTime ? start : std::max<int64_t>(start, 0);
    if (mByTime)
        return mInput.seekToTime(mPlace);
    if (!mInput.seekToByte(mPlace))
        return false;
    // What comes first is the rest of a frame, and its parser takes such a rest for a key frame.
    return mPlace == 0 || mInput.next(*mPacket);
}

bool FrameSearch::mayBegin(Begin begin) const
{
    if (begin == Begin::AnyPacket)
        return true;
    return (mPacket->flags & AV_PKT_FLAG_KEY) != 0 && (begin == Begin::AnyKey || mPlace <= mWanted);
}

void FrameSearch::notePlace()
{
    if (mByTime) {
        // Not every packet of a program stream has a time; then it comes soon after the one before.
        const int64_t time = mPacket->pts != AV_NOPTS_VALUE ? mPacket->pts : mPacket->dts;
        mPlace = time != AV_NOPTS_VALUE ? time : mPlace;
    } else {
        mPlace = mPacket->pos >= 0 ? mPacket->pos : mPlace;
        // A decoder hands on the time of each frame's packet. Where there are no times, that carries the place.
        mPacket->pts = mPlace;
        mPacket->dts = AV_NOPTS_VALUE;
    }
}

bool FrameSearch::decodeFrom(int64_t start, Begin begin)
{
    // The last attempt takes whatever comes, also from where the input stands now.
    if (!seek(start) && begin != Begin::AnyPacket)
        return false;
    bool begun = false;
    Step step = Step::More;
    while (step == Step::More && mPacketsLeft > 0 && mPixelsLeft > 0 && mInput.next(*mPacket)) {
        --mPacketsLeft;
        notePlace();
        begun = begun || mayBegin(begin);
        if (begun)
            step = feed(mPacket.get());
        // The place is passed without a key frame before it: the next attempt begins further back.
        else if (begin == Begin::KeyBeforePlace && mPlace > mWanted)
            return false;
    }
    // Frames that are kept back for reordering come out at the end.
    if (step == Step::More && begun)
        feed(nullptr);
    return mFound->buf[0] != nullptr;
}

FrameSearch::Step FrameSearch::feed(const AVPacket* packet)
{
    // A damaged packet is passed over; the decoder goes on with the next one.
    if (avcodec_send_packet(mDecoder.get(), packet) < 0)
        return Step::More;
    // Also for a packet that gives no frame, since it cost the work all the same.
    mPixelsLeft -= int64_t{mDecoder->width} * mDecoder->height;
    Step step = Step::Found;
    while ((step = take()) == Step::More) {
    }
    return step == Step::Found ? Step::Found : Step::More;
}

FrameSearch::Step FrameSearch::take()
{
    if (avcodec_receive_frame(mDecoder.get(), mFrame.get()) < 0)
        return Step::End;
    const int64_t place = mByTime ? mFrame->best_effort_timestamp : mFrame->pts;
    // A frame before the place is kept in case none comes after it.
    av_frame_unref(mFound.get());
    av_frame_move_ref(mFound.get(), mFrame.get());
    return place == AV_NOPTS_VALUE || place >= mWanted ? Step::Found : Step::More;
}

}  // namespace Kdd
