#include "platform/compression/CompressedCosts.h"

#include <lzma.h>

#include <memory>

namespace Kdd
{

namespace
{

constexpr uint64_t kWorkingMemory = uint64_t{64} << 20;  // [bytes]

struct End
{
    void operator()(lzma_stream* stream) const { lzma_end(stream); }
};

/// Gathers what comes out until the decoder takes in again.
class Stretch
{
public:
    explicit Stretch(const CostReceiver& tell)
        : mTell(tell)
    {
    }

    void takenIn(qint64 bits)
    {
        if (bits == 0)
            return;
        end();
        // What comes before the first byte is the head of the stream, and what the coder reads ahead.
        mBits = mIsHead ? 0 : bits;
        if (mIsHead)
            mTell(0, bits);
        mIsHead = false;
    }

    void cameOut(qint64 bytes) { mBytes += bytes; }

    void end()
    {
        if (mBytes > 0 || mBits > 0)
            mTell(mBytes, mBits);
        mBytes = mBits = 0;
    }

private:
    const CostReceiver& mTell;
    qint64 mBytes = 0;
    qint64 mBits = 0;
    bool mIsHead = true;
};

}  // namespace

bool lzmaCosts(const QByteArray& in, const CostReceiver& tell)
{
    lzma_stream stream = LZMA_STREAM_INIT;
    const std::unique_ptr<lzma_stream, End> owner(&stream);
    if (lzma_stream_decoder(&stream, kWorkingMemory, 0) != LZMA_OK)
        return false;
    stream.next_in = reinterpret_cast<const uint8_t*>(in.constData());
    stream.avail_in = static_cast<size_t>(in.size());
    Stretch stretch(tell);
    lzma_ret result = LZMA_OK;
    // Room for one byte at a time is what makes the decoder tell where it stands.
    while (result == LZMA_OK) {
        uint8_t byte = 0;
        const size_t had = stream.avail_in;
        stream.next_out = &byte;
        stream.avail_out = 1;
        result = lzma_code(&stream, LZMA_FINISH);
        stretch.takenIn(static_cast<qint64>(had - stream.avail_in) * 8);
        stretch.cameOut(stream.avail_out == 0 ? 1 : 0);
    }
    stretch.end();
    return result == LZMA_STREAM_END;
}

}  // namespace Kdd
