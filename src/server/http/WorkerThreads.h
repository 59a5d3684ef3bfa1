#pragma once

#include <condition_variable>
#include <deque>
#include <functional>
#include <mutex>
#include <thread>
#include <vector>

namespace Kdd::Http
{

/// Threads for work that may wait for disks and databases. What is handed over is begun in that order, and by the thread
/// that was busy last: what it has in its hands is warm, as its connection to the database is, and the others rest. May be
/// used on any thread.
class WorkerThreads
{
public:
    explicit WorkerThreads(int count);

    /// When all work is done, also what running work still hands over.
    ~WorkerThreads();

    void run(std::function<void()> work);

private:
    struct Resting
    {
        std::condition_variable changed;
        bool isCalled = false;
    };

    void workOff();
    void rest(std::unique_lock<std::mutex>& lock);

    std::mutex mMutex;
    std::deque<std::function<void()>> mWork;
    std::vector<Resting*> mResting;  // the last one is called first
    bool mEnds = false;
    std::vector<std::thread> mThreads;
};

}  // namespace Kdd::Http
