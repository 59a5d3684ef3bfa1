#include "platform/volume/ApartFrame.h"

#include "platform/decoder/DecoderPool.h"
#include "platform/volume/CompressedFrame.h"
#include "platform/volume/FrameLayout.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <limits>

namespace Kdd
{
namespace
{

// Codecs work with numbers of 32 bits, several of which stand for a value at a time, whatever its size is.
constexpr qint64 kMemoryOfValue = 24;
constexpr qint64 kMemoryOfByte = 4;
constexpr qint64 kLeastMemory = 128 << 20;

/// A layout as the decoder gets it, and what else it has to know.
struct FrameQuestion
{
    qint32 rows;
    qint32 columns;
    qint32 samples;
    qint32 bitsAllocated;
    qint32 bitsStored;
    qint32 highBit;
    qint32 isSigned;
    qint32 isFloat;
    qint32 colour;
    qint32 least;
    std::array<char, 16> photometric;  // no more of it is looked at
};

struct FrameAnswer
{
    qint32 width;
    qint32 height;
    qint32 components;
    qint32 type;
    qint32 colour;
    qint32 reduction;
};

FrameQuestion questionOf(const FrameLayout& layout, int least, StoredFrame::Colour colour)
{
    FrameQuestion question = {layout.rows,
                              layout.columns,
                              layout.samples,
                              layout.bitsAllocated,
                              layout.bitsStored,
                              layout.highBit,
                              layout.isSigned ? 1 : 0,
                              layout.isFloat ? 1 : 0,
                              static_cast<qint32>(colour),
                              least,
                              {}};
    std::memcpy(question.photometric.data(), layout.photometric.constData(),
                std::min(question.photometric.size(), std::size_t(layout.photometric.size())));
    return question;
}

FrameLayout layoutOf(const FrameQuestion& question)
{
    FrameLayout layout;
    layout.rows = question.rows;
    layout.columns = question.columns;
    layout.samples = question.samples;
    layout.bitsAllocated = question.bitsAllocated;
    layout.bitsStored = question.bitsStored;
    layout.highBit = question.highBit;
    layout.isSigned = question.isSigned != 0;
    layout.isFloat = question.isFloat != 0;
    const auto* name = question.photometric.data();
    layout.photometric = QByteArray(name, int(::strnlen(name, question.photometric.size())));
    return layout;
}

/// Rounded up, as each resolution of a codestream is.
qint64 halved(int size, int times)
{
    return (qint64(size) + (qint64(1) << times) - 1) >> times;
}

/// Whether a frame of that layout can have come out so.
bool isPossible(const FrameAnswer& answer, const FrameLayout& layout, int least, StoredFrame::Colour before)
{
    constexpr int kMaxReduction = 31;
    if (answer.reduction < 0 || answer.reduction > (least > 0 ? kMaxReduction : 0))
        return false;
    const auto colour = static_cast<StoredFrame::Colour>(answer.colour);
    const bool isColour =
        layout.samples == 3 && (colour == StoredFrame::Colour::Rgb || colour == StoredFrame::Colour::YbrFull);
    return answer.width == halved(layout.columns, answer.reduction) &&
           answer.height == halved(layout.rows, answer.reduction) && answer.components == layout.samples &&
           answer.type == static_cast<qint32>(layout.type()) && (isColour || colour == before);
}

}  // namespace

Result decodeFrameApart(DecoderPool& pool, const QByteArray& bytes, const FrameLayout& layout, int least,
                        StoredFrame& out)
{
    DecoderJob job;
    job.question.word = DecoderWord::Frame;
    job.question.head = bytesOf(questionOf(layout, least, out.colour));
    job.question.data = bytes;
    job.mostData = layout.frameBytes();
    DecoderMessage answer;
    const Result done = pool.run(DecoderKind::Frames, job, answer);
    if (done.bad())
        return done;
    FrameAnswer said = {};
    if (!readFrom(answer.head, said) || !isPossible(said, layout, least, out.colour))
        return Result::failure(QStringLiteral("The decoder gave a frame that cannot be"));
    const TypedData2D pixels = {said.width, said.height, said.components, layout.type(), answer.data};
    if (pixels.pixels.size() != pixels.rowStride() * pixels.height)
        return Result::failure(
            QStringLiteral("The decoder gave %1 bytes of pixels").arg(pixels.pixels.size()));
    out.pixels = pixels;
    out.colour = static_cast<StoredFrame::Colour>(said.colour);
    out.reduction = said.reduction;
    return {};
}

DecoderMessage answerFrame(const DecoderMessage& question)
{
    DecoderMessage answer;
    FrameQuestion asked = {};
    if (!readFrom(question.head, asked))
        return answer;
    StoredFrame frame;
    frame.colour = static_cast<StoredFrame::Colour>(asked.colour);
    const Result result = decodeCodestream(question.data, layoutOf(asked), asked.least, frame);
    if (result.bad()) {
        answer.head = result.text().toUtf8().left(DecoderChannel::kMaxHead);
        return answer;
    }
    const TypedData2D& pixels = frame.pixels;
    answer.word = DecoderWord::Done;
    answer.head =
        bytesOf(FrameAnswer{pixels.width, pixels.height, pixels.components, static_cast<qint32>(pixels.type),
                            static_cast<qint32>(frame.colour), frame.reduction});
    answer.data = pixels.pixels;
    return answer;
}

qint64 memoryForFrame(const DecoderMessage& question)
{
    FrameQuestion asked = {};
    if (!readFrom(question.head, asked))
        return kLeastMemory;
    return kLeastMemory + layoutOf(asked).numValues() * kMemoryOfValue + question.data.size() * kMemoryOfByte;
}

}  // namespace Kdd
