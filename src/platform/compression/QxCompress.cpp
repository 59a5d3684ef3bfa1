#include "platform/compression/QxCompress.h"

#include <QtEndian>

#include <libdeflate.h>

#include <limits>
#include <memory>

namespace
{

constexpr int kLevel = 6;
constexpr int kLengthSize = 4;
// One code of two bits at least, one for the length and one for the distance, yields 258 bytes at most.
constexpr qint64 kMaxExpansion = 1032;
// What a QByteArray can hold, with room for its own bookkeeping.
constexpr qint64 kMaxArray = std::numeric_limits<int>::max() - 64;

struct Free
{
    void operator()(libdeflate_compressor* compressor) const { libdeflate_free_compressor(compressor); }
    void operator()(libdeflate_decompressor* decompressor) const
    {
        libdeflate_free_decompressor(decompressor);
    }
};

// One per call, because they must not be shared between threads.
using Compressor = std::unique_ptr<libdeflate_compressor, Free>;
using Decompressor = std::unique_ptr<libdeflate_decompressor, Free>;

/// By the announced length alone, before memory is taken for it.
bool isPlausible(qint64 length, qint64 compressed, qint64 limit)
{
    return length <= limit && length <= kMaxArray && length <= compressed * kMaxExpansion;
}

}  // namespace

QByteArray qxCompress(const unsigned char* data, int size)
{
    const Compressor compressor(libdeflate_alloc_compressor(kLevel));
    if (size < 0 || !compressor)
        return {};
    // Nothing may come as a null pointer, which the compressor is never given.
    const void* from = size > 0 ? static_cast<const void*>(data) : "";
    const size_t bound = libdeflate_zlib_compress_bound(compressor.get(), static_cast<size_t>(size));
    if (bound > static_cast<size_t>(kMaxArray - kLengthSize))
        return {};

    QByteArray out(kLengthSize + static_cast<int>(bound), Qt::Uninitialized);
    qToBigEndian(static_cast<quint32>(size), out.data());
    const size_t written = libdeflate_zlib_compress(compressor.get(), from, static_cast<size_t>(size),
                                                    out.data() + kLengthSize, bound);
    // The bound leaves room for every content, so this is a failure of the library and never a full buffer.
    if (written == 0)
        return {};
    out.resize(kLengthSize + static_cast<int>(written));
    return out;
}

QByteArray qxUncompress(const QByteArray& in, qint64 limit)
{
    const qint64 compressed = in.size() - kLengthSize;
    if (compressed <= 0)
        return {};
    const qint64 length = qFromBigEndian<quint32>(in.constData());
    const Decompressor decompressor(libdeflate_alloc_decompressor());
    if (!isPlausible(length, compressed, limit) || !decompressor)
        return {};

    QByteArray out(static_cast<int>(length), Qt::Uninitialized);
    // Without a place for the actual length, fewer bytes than announced are an error as well.
    const auto result = libdeflate_zlib_decompress(decompressor.get(), in.constData() + kLengthSize,
                                                   static_cast<size_t>(compressed), out.data(),
                                                   static_cast<size_t>(length), nullptr);
    return result == LIBDEFLATE_SUCCESS ? out : QByteArray();
}
