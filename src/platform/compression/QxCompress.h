#pragma once

#include "platform/base/Export.h"

#include <QByteArray>

// The compressed form of records inside other files: fast, one buffer at a time.
//
//     offset  size  field
//     0       4     length of the content [bytes], unsigned and big-endian
//     4             the content as a zlib stream
//
// This is also what qCompress writes and qUncompress reads. Both functions may run on any number of threads.

/// Compresses `size` bytes at `data`, which may be null when there are none. A null array when `size` is negative or
/// the result would not fit a QByteArray.
KDD_EXPORT QByteArray qxCompress(const unsigned char* data, int size);

/// The content of `in`; an empty content gives an array that is empty but not null.
///
/// A null array, and no message, when `in` has 4 bytes or fewer, is damaged, or announces more than `limit` bytes
/// (default 256 MiB) or more than its compressed bytes can possibly yield. Memory is taken only after these checks.
KDD_EXPORT QByteArray qxUncompress(const QByteArray& in, qint64 limit = qint64{256} * 1024 * 1024);
