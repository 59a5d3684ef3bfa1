#pragma once

#include "platform/os/SystemResult.h"

#include <condition_variable>
#include <deque>
#include <functional>
#include <future>
#include <mutex>
#include <thread>
#include <vector>

namespace Kdd
{

/// Waits for the disk on threads of its own. Whoever has several files to wait for, or waits while others do, then waits
/// hardly longer than for one: the disk and the journal of its file system serve together all who wait at a time. May be
/// used on any thread.
class FlushThreads
{
public:
    using Flush = std::function<SystemResult()>;

    explicit FlushThreads(int threads);

    /// When all that was begun has ended.
    ~FlushThreads();
    FlushThreads(const FlushThreads&) = delete;
    FlushThreads& operator=(const FlushThreads&) = delete;

    /// What `flush` uses has to live until the result is there.
    std::future<SystemResult> begin(Flush flush);

private:
    void work();

    std::mutex mMutex;
    std::condition_variable mChanged;
    std::deque<std::packaged_task<SystemResult()>> mTasks;
    bool mEnds = false;
    std::vector<std::thread> mThreads;
};

}  // namespace Kdd
