#include "platform/base/OrderedWork.h"

#include <algorithm>
#include <atomic>

namespace Kdd
{

namespace
{

/// Beyond it one thread that keeps all in order is the slowest.
constexpr int kMostThreads = 16;

std::atomic<int> sTaken{0};

}  // namespace

ThreadShare::ThreadShare(int wanted, Of of)
    : mCount(wanted)
{
    const int cores = static_cast<int>(std::thread::hardware_concurrency());
    // Two that come at the same moment may both take the last core, which costs little.
    if (wanted <= 0)
        mCount = std::clamp(cores - sTaken, 1, kMostThreads);
    mCores = of == Of::Cores ? mCount : 0;
    sTaken += mCores;
}

ThreadShare::~ThreadShare()
{
    sTaken -= mCores;
}

}  // namespace Kdd
