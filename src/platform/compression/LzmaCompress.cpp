#include "platform/compression/LzmaCompress.h"

#include <lzma.h>

#include <limits>
#include <memory>
#include <optional>

namespace Kdd
{
namespace
{

constexpr uint32_t kPreset = 6;
constexpr uint64_t kWorkingMemory = uint64_t{64} << 20;  // [bytes]; preset 6 needs 9 MiB, preset 9 65 MiB
constexpr uint64_t kIndexMemory = uint64_t{1} << 20;     // [bytes], about 60000 blocks
// A match of 273 bytes takes at least 14 coded bits of 0.022 bit each, the least to which their odds adapt: 7100 : 1.
constexpr uint64_t kMaxExpansion = 8192;
// What a QByteArray can hold, with room for its own bookkeeping.
constexpr uint64_t kMaxArray = std::numeric_limits<int>::max() - 64;

struct FreeIndex
{
    void operator()(lzma_index* index) const { lzma_index_end(index, nullptr); }
};
using Index = std::unique_ptr<lzma_index, FreeIndex>;

const uint8_t* bytesOf(const QByteArray& array)
{
    return reinterpret_cast<const uint8_t*>(array.constData());
}

uint8_t* bytesOf(QByteArray& array)
{
    return reinterpret_cast<uint8_t*>(array.data());
}

/// The index is the last part before the footer; null when either is damaged.
/// The footer tells how long the index is; the decoder must end just where the footer begins.
Index readIndex(const QByteArray& in, const lzma_stream_flags& footer)
{
    // The length in the footer is a claim, held against what stands before the footer.
    const auto end = static_cast<size_t>(in.size()) - LZMA_STREAM_HEADER_SIZE;
    if (footer.backward_size > end)
        return nullptr;
    lzma_index* index = nullptr;
    uint64_t memory = kIndexMemory;
    size_t at = end - static_cast<size_t>(footer.backward_size);
    if (lzma_index_buffer_decode(&index, &memory, nullptr, bytesOf(in), &at, end) != LZMA_OK)
        return nullptr;
    Index owner(index);
    return at == end ? std::move(owner) : nullptr;
}

/// The announced length of the content, when `in` ends with a stream that has an integrity check.
std::optional<uint64_t> contentLength(const QByteArray& in)
{
    if (in.size() < 2 * LZMA_STREAM_HEADER_SIZE)
        return {};
    lzma_stream_flags footer = {};
    if (lzma_stream_footer_decode(&footer, bytesOf(in) + in.size() - LZMA_STREAM_HEADER_SIZE) != LZMA_OK)
        return {};
    // The decoder passes over checks that it does not know.
    if (footer.check == LZMA_CHECK_NONE || !lzma_check_is_supported(footer.check))
        return {};
    const Index index = readIndex(in, footer);
    if (!index)
        return {};
    // The sum over all blocks, so that memory is taken once and its size is known before.
    return lzma_index_uncompressed_size(index.get());
}

bool isPlausible(uint64_t length, int compressed, qint64 limit)
{
    return limit >= 0 && length <= static_cast<uint64_t>(limit) && length <= kMaxArray &&
           length <= static_cast<uint64_t>(compressed) * kMaxExpansion;
}

QByteArray emptyContent()
{
    return QByteArray("");
}

}  // namespace

QByteArray lzmaCompress(const QByteArray& bytes)
{
    if (bytes.isEmpty())
        return emptyContent();
    const auto size = static_cast<size_t>(bytes.size());
    const size_t bound = lzma_stream_buffer_bound(size);
    // 0 stands for a size that the library does not take.
    if (bound == 0 || bound > kMaxArray)
        return {};

    QByteArray out(static_cast<int>(bound), Qt::Uninitialized);
    size_t written = 0;
    if (lzma_easy_buffer_encode(kPreset, LZMA_CHECK_CRC64, nullptr, bytesOf(bytes), size, bytesOf(out),
                                &written, bound) != LZMA_OK)
        return {};
    out.resize(static_cast<int>(written));
    return out;
}

QByteArray lzmaUncompress(const QByteArray& in, qint64 limit)
{
    if (in.isEmpty())
        return emptyContent();
    const std::optional<uint64_t> length = contentLength(in);
    if (!length || !isPlausible(*length, in.size(), limit))
        return {};

    QByteArray out(static_cast<int>(*length), Qt::Uninitialized);
    uint64_t memory = kWorkingMemory;
    const auto inSize = static_cast<size_t>(in.size());
    const auto outSize = static_cast<size_t>(out.size());
    size_t inAt = 0;
    size_t outAt = 0;
    const lzma_ret result = lzma_stream_buffer_decode(&memory, 0, nullptr, bytesOf(in), &inAt, inSize,
                                                      bytesOf(out), &outAt, outSize);
    // The decoder stops after one stream, so what is left over is another one or none at all.
    return result == LZMA_OK && inAt == inSize && outAt == outSize ? out : QByteArray();
}

}  // namespace Kdd
