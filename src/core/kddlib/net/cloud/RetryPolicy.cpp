#include "kddlib/net/cloud/RetryPolicy.h"

#include <algorithm>
#include <cmath>

namespace Kdd
{
namespace
{

constexpr qint64 kMaxJitter = 1000;  // [ms]

}  // namespace

std::chrono::milliseconds RetryPolicy::nextDelay()
{
    // Counted once only, so that asking again after the end does not wrap.
    if (!exhausted())
        ++mAttempts;
    if (exhausted())
        // After the last failure there is nothing to wait for.
        return std::chrono::milliseconds(0);
    const std::chrono::milliseconds delay = mDelay + jitter();
    const std::chrono::milliseconds longer(std::llround(static_cast<double>(mDelay.count()) * mMultiplier));
    mDelay = std::min(longer, mMaxDelay);
    return delay;
}

std::chrono::milliseconds RetryPolicy::jitter()
{
    if (!mEngine)
        mEngine = std::make_unique<std::mt19937_64>(std::random_device()());
    return std::chrono::milliseconds(std::uniform_int_distribution<qint64>(0, kMaxJitter)(*mEngine));
}

}  // namespace Kdd
