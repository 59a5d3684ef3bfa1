#pragma once

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

}  // namespace Kdd::VolumeFile
