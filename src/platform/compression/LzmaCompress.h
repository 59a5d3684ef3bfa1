#pragma once

#include <QByteArray>

namespace Kdd
{

// The small and slow form, for what is written once and kept long: an .xz file with one stream, whose checks find
// every changed byte. The xz tool reads and writes the same. Both functions may run on any number of threads.

/// Compresses `bytes` at preset 6 (about 2 MB a second) with a CRC-64. Nothing becomes nothing: an empty array gives
/// one that is empty but not null. A null array when memory does not suffice.
QByteArray lzmaCompress(const QByteArray& bytes);

/// The content of `in`; an empty content, like an empty `in`, gives an array that is empty but not null.
///
/// A null array when `in` is damaged, carries no integrity check, is followed by anything (also by a second stream),
/// needs more than 64 MiB of working memory, or announces more than `limit` bytes (default 256 MiB) or more than
/// its compressed bytes can possibly yield. Memory for the content is taken once, after
/// the lengths are checked.
QByteArray lzmaUncompress(const QByteArray& in, qint64 limit = qint64{256} * 1024 * 1024);

}  // namespace Kdd
