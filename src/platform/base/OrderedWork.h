#pragma once

#include <condition_variable>
#include <functional>
#include <future>
#include <map>
#include <mutex>
#include <thread>
#include <utility>
#include <vector>

namespace Kdd
{

/// Threads for a piece of work, the caller's own among them. Where no number is asked for, they are as many as there are
/// cores that no other share of the process has: what is done at the same time does not ask for all of them twice.
class ThreadShare
{
public:
    /// What the threads take: cores, or mostly patience, as those that wait for servers. The latter are not held against
    /// the cores that others ask for.
    enum class Of { Cores, Waiting };

    /// `wanted` threads; 0: as many as there are cores to spare, at least one and at most 16.
    explicit ThreadShare(int wanted, Of of = Of::Cores);
    ~ThreadShare();
    ThreadShare(const ThreadShare&) = delete;
    ThreadShare& operator=(const ThreadShare&) = delete;

    int count() const { return mCount; }

private:
    int mCount = 1;
    int mCores = 0;  // of which others are told
};

/// Makes results on several threads and hands them on in their order, whichever is made first. The threads end with the
/// object; what was begun and not taken is lost then. Used by one thread, which makes what it is about to take
/// itself when nobody has begun it: with one thread all is made when it is taken.
template <typename Made>
class OrderedWork
{
public:
    /// `make(i)` is called for 0 <= i < `count` on any thread, once for each i and at most so far ahead of what was taken
    /// that each thread has two results waiting. `threads` as in `ThreadShare`.
    OrderedWork(int count, int threads, std::function<Made(int)> make,
                ThreadShare::Of of = ThreadShare::Of::Cores)
        : mCount(count)
        , mMake(std::move(make))
        , mShare(threads, of)
    {
        for (int i = 1; i < mShare.count() && i < count; ++i)
            mHelpers.emplace_back([this] { help(); });
    }

    ~OrderedWork()
    {
        {
            const std::lock_guard<std::mutex> lock(mMutex);
            mBegun = mCount;
        }
        mTurn.notify_all();
        for (std::thread& helper : mHelpers)
            helper.join();
    }
    OrderedWork(const OrderedWork&) = delete;
    OrderedWork& operator=(const OrderedWork&) = delete;

    /// The next result, or what `make` threw in its place. To be called `count` times at most.
    Made next()
    {
        std::unique_lock<std::mutex> lock(mMutex);
        const int i = mTaken++;
        const bool isBegun = i < mBegun;
        std::future<Made> made;
        if (isBegun) {
            made = std::move(mMade.at(i));
            mMade.erase(i);
        } else {
            ++mBegun;
        }
        lock.unlock();
        mTurn.notify_all();
        return isBegun ? made.get() : mMake(i);
    }

private:
    void help()
    {
        std::unique_lock<std::mutex> lock(mMutex);
        while (true) {
            mTurn.wait(lock, [this] { return mBegun >= mCount || mBegun < mTaken + 2 * mShare.count(); });
            if (mBegun >= mCount)
                return;
            const int i = mBegun++;
            std::packaged_task<Made()> task([this, i] { return mMake(i); });
            mMade.emplace(i, task.get_future());
            lock.unlock();
            task();
            lock.lock();
        }
    }

    const int mCount;
    const std::function<Made(int)> mMake;
    const ThreadShare mShare;
    std::mutex mMutex;  // of what follows
    std::condition_variable mTurn;
    int mBegun = 0;
    int mTaken = 0;
    std::map<int, std::future<Made>> mMade;  // begun and not taken
    std::vector<std::thread> mHelpers;
};

}  // namespace Kdd
