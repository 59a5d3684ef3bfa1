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

}  // namespace Kdd
