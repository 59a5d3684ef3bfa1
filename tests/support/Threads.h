#pragma once

#include <atomic>
#include <functional>
#include <thread>
#include <vector>

namespace Kdd
{

/// Runs the work on so many threads, each with its number from 0 on, which begin together; returns when all are done.
inline void onThreads(int count, const std::function<void(int thread)>& work)
{
    std::atomic<int> waiting = count;
    std::vector<std::thread> threads;
    for (int i = 0; i < count; ++i) {
        threads.emplace_back([&, i] {
            for (--waiting; waiting > 0;)
                std::this_thread::yield();
            work(i);
        });
    }
    for (std::thread& thread : threads)
        thread.join();
}

}  // namespace Kdd
