#pragma once

#include <chrono>

namespace Kdd
{

/// Elapsed time since its making.
class Stopwatch
{
public:
    /// [ms], whole milliseconds.
    int elapsed() const
    {
        using namespace std::chrono;
        return static_cast<int>(duration_cast<milliseconds>(steady_clock::now() - mStart).count());
    }

private:
    std::chrono::steady_clock::time_point mStart = std::chrono::steady_clock::now();
};

/// The sum of many times, each of which may be far shorter than a millisecond.
class StopwatchSum
{
public:
    /// Adds the time from its making to its end.
    class Running
    {
    public:
        explicit Running(StopwatchSum& sum)
            : mSum(sum)
        {
        }
        ~Running() { mSum.mTotal += std::chrono::steady_clock::now() - mStart; }
        Running(const Running&) = delete;
        Running& operator=(const Running&) = delete;

    private:
        StopwatchSum& mSum;
        std::chrono::steady_clock::time_point mStart = std::chrono::steady_clock::now();
    };

    /// [ms], whole milliseconds.
    int elapsed() const
    {
        return static_cast<int>(std::chrono::duration_cast<std::chrono::milliseconds>(mTotal).count());
    }

private:
    std::chrono::steady_clock::duration mTotal{};
};

}  // namespace Kdd
