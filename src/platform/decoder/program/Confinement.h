#pragma once

#include "platform/base/Result.h"

namespace Kdd
{

/// Whether this is built with a checker of memory or types: it reserves more memory than any machine has, and makes system
/// calls of its own.
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr bool kIsCheckedBuild = true;
#elif defined(__has_feature)
constexpr bool kIsCheckedBuild = __has_feature(address_sanitizer) || __has_feature(thread_sanitizer);
#else
constexpr bool kIsCheckedBuild = false;
#endif

/// The only descriptor that a decoder has: what it says and is told.
constexpr int kDecoderSocket = 0;

/// Takes away from this process all that decoding does not need: files, the network, other processes, privileges,
/// memory that is run, core files. What it tries nevertheless fails; where nobody would try it without ill intent it ends the
/// process. What is loaded has to be loaded before. Failure when the system cannot take it away.
Result confine();

/// Gives this process so much memory more than it takes when it is called for the first time [bytes].
void limitMemory(long long bytes);

/// Has this process end when so much time has passed [ms]; 0: not any more.
void endAfter(long ms);

}  // namespace Kdd
