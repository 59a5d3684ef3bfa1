#pragma once

#include "platform/base/Result.h"

namespace Kdd
{

/// The only descriptor that a decoder has: what it says and is told.
constexpr int kDecoderSocket = 0;

/// Takes away from this process all that decoding does not need: files, the network, other processes, privileges,
/// memory that is run, core files. What it tries nevertheless fails; where nobody would try it without ill intent it ends the
/// process. What is loaded has to be loaded before. Failure when the system cannot take it away.
Result confine();

/// Gives this process so much memory more than it takes when it is called for the first time [bytes].
void limitMemory(long long bytes);

}  // namespace Kdd
