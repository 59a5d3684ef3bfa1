#include "platform/volume/ApartVideo.h"

#include "platform/decoder/DecoderPool.h"
#include "platform/volume/KxCompressedDataMedia.h"

#include <algorithm>
#include <cstring>
#include <limits>

namespace Kdd
{
namespace
{

// More than the module reads of any video.
constexpr qint64 kMostRead = qint64(512) << 20;

struct VideoQuestion
{
    qint64 size;       ///< of the source [bytes]
    quint64 fraction;  ///< the bits of the number, so that it is the very same
    qint32 width;
    qint32 height;
};

struct VideoAnswer
{
    qint32 width;
    qint32 height;
};

quint64 bitsOf(double number)
{
    quint64 bits = 0;
    std::memcpy(&bits, &number, sizeof bits);
    return bits;
}

double numberOf(quint64 bits)
{
    double number = 0;
    std::memcpy(&number, &bits, sizeof number);
    return number;
}

/// The source as the decoder sees it.
class AskedSource : public MediaSource
{
public:
    AskedSource(const DecoderChannel& channel, qint64 size)
        : mChannel(channel)
        , mSize(size)
    {
    }
    qint64 size() const override { return mSize; }
    qint64 read(qint64 offset, char* out, qint64 length) override
    {
        return askForBytes(mChannel, offset, out, length);
    }

private:
    const DecoderChannel& mChannel;
    qint64 mSize;
};

}  // namespace

Result decodeVideoApart(DecoderPool& pool, MediaSource& source, const VideoPlace& place, TypedData2D& frame)
{
    DecoderJob job;
    job.question.word = DecoderWord::Video;
    job.question.head =
        bytesOf(VideoQuestion{source.size(), bitsOf(place.fraction), place.width, place.height});
    job.source = [&](qint64 offset, char* out, qint64 length) { return source.read(offset, out, length); };
    job.mostRead = kMostRead;
    // Divided, as both sides of the picture may be as large as numbers go.
    const qint64 most = std::numeric_limits<int>::max() / 2;
    job.mostData = place.width > most / 3 / place.height ? most : qint64(place.width) * place.height * 3;
    DecoderMessage answer;
    const Result done = pool.run(DecoderKind::Videos, job, answer);
    if (done.bad())
        return done;
    VideoAnswer said = {};
    const bool isPossible = readFrom(answer.head, said) && said.width > 0 && said.width <= place.width &&
                            said.height > 0 && said.height <= place.height &&
                            answer.data.size() == qint64(said.width) * said.height * 3;
    if (!isPossible)
        return Result::failure(QStringLiteral("The decoder gave a frame that cannot be"));
    frame = {said.width, said.height, 3, PrimitiveType::UInt8, answer.data};
    return {};
}

DecoderMessage answerVideo(const DecoderChannel& channel, const DecoderMessage& question)
{
    DecoderMessage answer;
    VideoQuestion asked = {};
    if (!readFrom(question.head, asked))
        return answer;
    AskedSource source(channel, asked.size);
    TypedData2D frame;
    const Result result =
        decodeVideoInside(source, {asked.width, asked.height, numberOf(asked.fraction)}, frame);
    if (result.bad()) {
        answer.head = result.text().toUtf8().left(DecoderChannel::kMaxHead);
        return answer;
    }
    answer.word = DecoderWord::Done;
    answer.head = bytesOf(VideoAnswer{frame.width, frame.height});
    answer.data = frame.pixels;
    return answer;
}

}  // namespace Kdd
