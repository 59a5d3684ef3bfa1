#pragma once

#include "platform/base/Result.h"
#include "platform/decoder/DecoderChannel.h"
#include "platform/volume/StoredFrame.h"

#include <QByteArray>

namespace Kdd
{

class DecoderPool;
struct FrameLayout;

/// Decodes a codestream as decodeCodestream does, with the same result, in a decoder of `pool`. What it answers is held
/// against the layout before it is taken.
Result decodeFrameApart(DecoderPool& pool, const QByteArray& bytes, const FrameLayout& layout, int least,
                        StoredFrame& out);

/// What the decoder does with the question and says to it.
DecoderMessage answerFrame(const DecoderMessage& question);

/// How much memory the decoder may take for a question [bytes].
qint64 memoryForFrame(const DecoderMessage& question);

}  // namespace Kdd
