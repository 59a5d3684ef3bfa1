#include "platform/volumefile/ChunkCoding.h"

#include <libdeflate.h>

#include <memory>

namespace Kdd::VolumeFile
{
namespace
{

// Higher levels take several times as long and save a few percent of a shuffled image.
constexpr int kLevel = 1;
// One code of two bits at least, one for the length and one for the distance, yields 258 bytes at most.
constexpr qint64 kMaxExpansion = 1032;

struct Free
{
    void operator()(libdeflate_compressor* compressor) const { libdeflate_free_compressor(compressor); }
    void operator()(libdeflate_decompressor* decompressor) const
    {
        libdeflate_free_decompressor(decompressor);
    }
};

}  // namespace

QByteArray shuffled(const QByteArray& elements, int elementSize)
{
    const int count = elements.size() / elementSize;
    QByteArray planes(elements.size(), Qt::Uninitialized);
    char* to = planes.data();
    for (int byte = 0; byte < elementSize; ++byte) {
        const char* from = elements.constData() + byte;
        for (int i = 0; i < count; ++i, from += elementSize)
            *to++ = *from;
    }
    return planes;
}

QByteArray unshuffled(const QByteArray& planes, int elementSize)
{
    const int count = planes.size() / elementSize;
    QByteArray elements(planes.size(), Qt::Uninitialized);
    const char* from = planes.constData();
    for (int byte = 0; byte < elementSize; ++byte) {
        char* to = elements.data() + byte;
        for (int i = 0; i < count; ++i, to += elementSize)
            *to = *from++;
    }
    return elements;
}

QByteArray deflated(const QByteArray& content)
{
    // One for each call, because they must not be shared between threads.
    const std::unique_ptr<libdeflate_compressor, Free> compressor(libdeflate_alloc_compressor(kLevel));
    if (!compressor)
        return {};
    const auto size = static_cast<std::size_t>(content.size());
    const std::size_t bound = libdeflate_zlib_compress_bound(compressor.get(), size);
    QByteArray stream(static_cast<int>(bound), Qt::Uninitialized);
    const std::size_t written =
        libdeflate_zlib_compress(compressor.get(), content.constData(), size, stream.data(), bound);
    if (written == 0)
        return {};
    stream.resize(static_cast<int>(written));
    return stream;
}

bool canInflate(qint64 streamSize, qint64 contentSize)
{
    return contentSize / kMaxExpansion <= streamSize;
}

QByteArray inflated(const QByteArray& stream, int size)
{
    const std::unique_ptr<libdeflate_decompressor, Free> decompressor(libdeflate_alloc_decompressor());
    if (!decompressor)
        return {};
    // Without a place for the actual size, a content of fewer bytes is an error as well.
    QByteArray content(size, Qt::Uninitialized);
    const libdeflate_result result = libdeflate_zlib_decompress(
        decompressor.get(), stream.constData(), static_cast<std::size_t>(stream.size()), content.data(),
        static_cast<std::size_t>(size), nullptr);
    return result == LIBDEFLATE_SUCCESS ? content : QByteArray();
}

Result checkStored(qint64 stored, qint64 fileSize, const ChunkForm& form)
{
    // What compression may add to a chunk that cannot be compressed.
    constexpr qint64 kMaxOverhead = 1024;
    if (stored == 0)
        return Result::failure(QStringLiteral("is not in the file"));
    // A length that cannot be is refused before memory is taken for it.
    const qint64 most = qint64(form.chunkBytes) + form.chunkBytes / 16 + kMaxOverhead;
    if (stored < 0 || stored > fileSize || stored > most || !canInflate(stored, form.chunkBytes))
        return Result::failure(QStringLiteral("claims %1 bytes for %2").arg(stored).arg(form.chunkBytes));
    return {};
}

/// In the reverse order of writing: first the compression, then the shuffling.
Result decodeChunk(const QByteArray& stored, unsigned skippedFilters, const ChunkForm& form,
                   QByteArray& bytes)
{
    // Other writers store a chunk as it is when a filter gains nothing, and mark the filter by its place.
    const unsigned deflate = form.isShuffled ? 2 : 1;
    const bool isShuffled = form.isShuffled && (skippedFilters & 1U) == 0;
    const QByteArray content = (skippedFilters & deflate) != 0 ? stored : inflated(stored, form.chunkBytes);
    // What was stored uncompressed has not been held against its exact size yet.
    if (content.size() != form.chunkBytes)
        return Result::failure(QStringLiteral("is damaged"));
    bytes = isShuffled ? unshuffled(content, form.elementSize) : content;
    return {};
}

}  // namespace Kdd::VolumeFile
