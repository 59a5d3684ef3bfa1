#pragma once

#include "platform/base/Result.h"
#include "platform/decoder/DecoderChannel.h"

namespace Kdd::VolumeFile
{

/// What the decoder does with the question of openApart and says to it; it asks for bytes by `channel`.
DecoderMessage answerVolume(const DecoderChannel& channel, const DecoderMessage& question);

/// Loads the library and uses it once.
Result prepareVolumes();

}  // namespace Kdd::VolumeFile
