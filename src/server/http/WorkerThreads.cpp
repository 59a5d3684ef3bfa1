#include "server/http/WorkerThreads.h"

namespace Kdd::Http
{

WorkerThreads::WorkerThreads(int count)
{
    for (int i = 0; i < count; ++i)
        mThreads.emplace_back([this] { workOff(); });
}

WorkerThreads::~WorkerThreads()
{
    {
        const std::lock_guard<std::mutex> lock(mMutex);
        mEnds = true;
        for (Resting* resting : mResting) {
            resting->isCalled = true;
            resting->changed.notify_one();
        }
        mResting.clear();
    }
    for (std::thread& thread : mThreads)
        thread.join();
}

void WorkerThreads::run(std::function<void()> work)
{
    const std::lock_guard<std::mutex> lock(mMutex);
    mWork.push_back(std::move(work));
    if (mResting.empty())
        return;
    Resting* called = mResting.back();
    mResting.pop_back();
    called->isCalled = true;
    // Under the lock: what it waits with is gone as soon as it is called.
    called->changed.notify_one();
}

void WorkerThreads::rest(std::unique_lock<std::mutex>& lock)
{
    Resting self;
    mResting.push_back(&self);
    self.changed.wait(lock, [&] { return self.isCalled; });
}

void WorkerThreads::workOff()
{
    std::unique_lock<std::mutex> lock(mMutex);
    while (true) {
        while (mWork.empty() && !mEnds)
            rest(lock);
        if (mWork.empty())
            return;
        std::function<void()> work = std::move(mWork.front());
        mWork.pop_front();
        lock.unlock();
        work();
        // What it holds goes without the lock, for it may be the last to hold a connection.
        work = nullptr;
        lock.lock();
    }
}

}  // namespace Kdd::Http
