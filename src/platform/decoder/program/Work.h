#pragma once

#include "platform/base/Result.h"
#include "platform/decoder/DecoderProcess.h"

namespace Kdd
{

/// Loads what this kind of decoder works with, and uses each part of it once, so that nothing is left for which a file is
/// read. Failure names what is missing.
Result prepareFor(DecoderKind kind);

/// Does jobs until nobody is there any more who gives some.
void work(DecoderChannel& channel);

}  // namespace Kdd
