#pragma once

#include <QtGlobal>

#include <chrono>
#include <memory>
#include <random>

namespace Kdd
{

/// How often one operation is tried, and how long to wait in between: five times, with waits of 1, 2, 4 and 8 seconds,
/// each longer by up to a second at random, so that clients that failed together do not come back together.
///
/// Each operation has one of its own.
class RetryPolicy
{
public:
    /// Whether the operation has failed for the last time.
    bool exhausted() const { return mAttempts >= mMaxAttempts; }

    /// Counts a failure. The time until the next attempt; 0 when there is none.
    std::chrono::milliseconds nextDelay();

private:
    std::chrono::milliseconds jitter();

    quint32 mAttempts = 0;
    quint32 mMaxAttempts = 5;
    std::chrono::milliseconds mDelay{1000};
    std::chrono::milliseconds mMaxDelay{300'000};
    double mMultiplier = 2.0;
    std::unique_ptr<std::mt19937_64> mEngine;  // made when first needed, because most operations never fail
};

}  // namespace Kdd
