#pragma once

#include "platform/base/Result.h"

#include <QByteArray>

// The two filters of volume files, by the library's definition of them. They run here and not inside the library,
// because there they would hold its one lock, and would let a small chunk grow to any size.
namespace Kdd::VolumeFile
{

/// Puts the first bytes of all elements together, then the second ones, and so on. Like bytes compress better. The
/// size is a multiple of `elementSize`.
QByteArray shuffled(const QByteArray& elements, int elementSize);
QByteArray unshuffled(const QByteArray& planes, int elementSize);

/// A zlib stream; null when memory is short.
QByteArray deflated(const QByteArray& content);

/// Whether a zlib stream of that length can hold a content of that length.
bool canInflate(qint64 streamSize, qint64 contentSize);

/// Null when the stream is damaged or its content has not exactly `size` bytes.
QByteArray inflated(const QByteArray& stream, int size);

/// How the chunks of a dataset are stored.
struct ChunkForm
{
    int elementSize = 1;      ///< [bytes]
    int chunkBytes = 0;       ///< of each chunk, once its filters are undone
    bool isShuffled = false;  ///< before the compression
};

/// Where a chunk is stored; of no bytes when it is not there.
struct ChunkPlace
{
    qint64 offset = 0;
    qint64 size = 0;  ///< [bytes]
    quint32 skippedFilters = 0;
    quint32 isShuffled = 0;
};

/// Whether a chunk can take so many bytes of a file of that size; if not, the failure.
Result checkStored(qint64 stored, qint64 fileSize, const ChunkForm& form);

/// Undoes the filters of a chunk but those that were left out, one bit for each.
Result decodeChunk(const QByteArray& stored, unsigned skippedFilters, const ChunkForm& form,
                   QByteArray& bytes);

}  // namespace Kdd::VolumeFile
