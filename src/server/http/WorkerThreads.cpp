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
    }
    mChanged.notify_all();
    for (std::thread& thread : mThreads)
        thread.join();
}

void WorkerThreads::run(std::function<void()> work)
{
    {
        const std::lock_guard<std::mutex> lock(mMutex);
        mWork.push_back(std::move(work));
    }
    mChanged.notify_one();
}

void WorkerThreads::workOff()
{
    std::unique_lock<std::mutex> lock(mMutex);
    while (true) {
        mChanged.wait(lock, [this] { return mEnds || !mWork.empty(); });
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
