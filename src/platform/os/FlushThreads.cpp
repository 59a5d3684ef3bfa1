#include "platform/os/FlushThreads.h"

#include <utility>

namespace Kdd
{

FlushThreads::FlushThreads(int threads)
{
    for (int i = 0; i < threads; ++i)
        mThreads.emplace_back([this] { work(); });
}

FlushThreads::~FlushThreads()
{
    {
        const std::lock_guard<std::mutex> lock(mMutex);
        mEnds = true;
    }
    mChanged.notify_all();
    for (std::thread& thread : mThreads)
        thread.join();
}

std::future<SystemResult> FlushThreads::begin(Flush flush)
{
    std::packaged_task<SystemResult()> task(std::move(flush));
    std::future<SystemResult> result = task.get_future();
    {
        const std::lock_guard<std::mutex> lock(mMutex);
        mTasks.push_back(std::move(task));
    }
    mChanged.notify_one();
    return result;
}

void FlushThreads::work()
{
    std::unique_lock<std::mutex> lock(mMutex);
    while (true) {
        mChanged.wait(lock, [this] { return mEnds || !mTasks.empty(); });
        if (mTasks.empty())
            return;
        std::packaged_task<SystemResult()> task = std::move(mTasks.front());
        mTasks.pop_front();
        lock.unlock();
        task();
        lock.lock();
    }
}

}  // namespace Kdd
