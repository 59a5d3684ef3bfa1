#pragma once

#include <QByteArray>

#include <functional>

namespace Kdd
{

// What each stretch of a content takes in its compressed form. Decompressors tell it on the way and nobody asks them:
// here the stream is walked for that alone. All functions may run on any number of threads.

/// Receives, in the order of the content, that its next `bytes` bytes take `bits` bits. None stands for what the
/// stream needs for itself, such as code tables.
using CostReceiver = std::function<void(qint64 bytes, qint64 bits)>;

/// Walks what `qxCompress` gave. Exact: each literal is told by itself, and each repetition with all the bytes that it
/// repeats. What is not told of the size of `in` are its frame and the checksum. False when the stream is
/// damaged; what was told until then counts for nothing. The content itself is not checked.
bool qxCosts(const QByteArray& in, const CostReceiver& tell);

/// Walks what `lzmaCompress` gave. A range coder has no bits of its own for one literal, so told are the bytes of content
/// that come out between two at which the decoder takes in more: a single byte of the stream, mostly. False as above,
/// and when more than 64 MiB of working memory are needed.
bool lzmaCosts(const QByteArray& in, const CostReceiver& tell);

}  // namespace Kdd
