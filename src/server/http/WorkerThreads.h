#pragma once

#include <condition_variable>
#include <deque>
#include <functional>
#include <mutex>
#include <thread>
#include <vector>

namespace Kdd::Http
{

/// Threads for work that may wait for disks and databases. What is handed over is begun in that order. May be used on any
/// thread.
class WorkerThreads
{
public:
    explicit WorkerThreads(int count);

    /// When all work is done, also what running work still hands over.
    ~WorkerThreads();

    void run(std::function<void()> work);

private:
    void workOff();

    std::mutex mMutex;
    std::condition_variable mChanged;
    std::deque<std::function<void()>> mWork;
    bool mEnds = false;
    std::vector<std::thread> mThreads;
};

}  // namespace Kdd::Http
