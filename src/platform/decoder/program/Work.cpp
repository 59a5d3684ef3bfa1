#include "platform/decoder/program/Work.h"

#include "platform/decoder/program/Confinement.h"
#include "platform/late/LateLibrary.h"
#include "platform/volume/ApartFrame.h"
#include "platform/volume/ApartVideo.h"
#include "platform/volume/CompressedFrame.h"
#include "platform/volume/FrameEncoding.h"
#include "platform/volume/FrameLayout.h"
#include "platform/volumefile/ApartVolume.h"

#include <exception>
#include <limits>

namespace Kdd
{
namespace
{

// Longer than whoever gives the jobs waits for one: this counts where that one has ended.
constexpr long kMostSeconds = 300;

// The largest pictures that are decoded, and as many of them as a stream may refer to.
constexpr qint64 kVideoMemory = qint64(3) << 30;

// All parameters that a volume file may have, as the library and as we hold them.
constexpr qint64 kVolumeMemory = qint64(1) << 30;

/// A frame that was compressed here is decoded again.
Result tryCoding(FrameCoding coding)
{
    FrameLayout layout;
    layout.rows = layout.columns = 8;
    layout.photometric = "MONOCHROME2";
    const QByteArray pixels(64, 'x');
    QByteArray bytes;
    StoredFrame frame;
    Result result = encodeFrame(coding, pixels, layout, bytes);
    if (result.good())
        result = decodeCodestream(bytes, layout, 0, frame);
    if (result.good() && frame.pixels.pixels != pixels)
        result = Result::failure(QStringLiteral("a frame does not come out as it went in"));
    return result;
}

Result prepareFrames()
{
    Result result = loadLate(LateLibrary::Codecs);
    for (const FrameCoding coding : {FrameCoding::JpegLossless, FrameCoding::JpegLs}) {
        if (result.good())
            result = tryCoding(coding);
    }
    if (result.bad())
        return result;
    // Of JPEG 2000 there is no encoder here; that this is refused takes its library too.
    StoredFrame frame;
    (void)decodeCodestream(QByteArray("\xff\x4f\xff\x51\0\0", 6), FrameLayout(), 0, frame);
    return {};
}

DecoderMessage answerTo(const DecoderChannel& channel, const DecoderMessage& question)
{
    DecoderMessage failure;
    try {
        switch (question.word) {
        case DecoderWord::Frame:
            limitMemory(memoryForFrame(question));
            return answerFrame(question);
        case DecoderWord::Video:
            limitMemory(kVideoMemory);
            return answerVideo(channel, question);
        case DecoderWord::Volume:
            limitMemory(kVolumeMemory);
            return VolumeFile::answerVolume(channel, question);
        default:
            failure.head = "The decoder does not know what to do";
            return failure;
        }
    } catch (const std::exception& fault) {
        failure.head = QByteArray("It cannot be decoded: ") + fault.what();
        return failure;
    }
}

}  // namespace

Result prepareFor(DecoderKind kind)
{
    switch (kind) {
    case DecoderKind::Frames:
        return prepareFrames();
    case DecoderKind::Videos:
        return loadVideoModule();
    case DecoderKind::VolumeFiles:
        break;
    }
    return VolumeFile::prepareVolumes();
}

void work(DecoderChannel& channel)
{
    DecoderMessage question;
    while (channel.receive(std::numeric_limits<int>::max(), question) == DecoderChannel::Outcome::Done) {
        endAfter(kMostSeconds * 1000);
        const DecoderMessage answer = answerTo(channel, question);
        endAfter(0);
        if (channel.send(answer) != DecoderChannel::Outcome::Done)
            return;
        // The room of large frames is not kept for small ones.
        question = {};
    }
}

}  // namespace Kdd
