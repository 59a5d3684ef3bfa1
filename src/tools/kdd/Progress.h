#pragma once

#include <QString>

#include <chrono>

namespace Kdd
{

/// A line on standard error that tells how far a long work has come: share, count, rate and remaining time. Nothing
/// is drawn when standard error is no terminal, or when progress is not wanted. Wiped when the object goes.
class Progress
{
public:
    Progress(const char* what, bool isWanted);
    ~Progress();
    Progress(const Progress&) = delete;
    Progress& operator=(const Progress&) = delete;

    void show(qint64 done, qint64 total);

private:
    using Clock = std::chrono::steady_clock;

    const char* mWhat;
    bool mIsDrawn;
    Clock::time_point mStart = Clock::now();
    Clock::time_point mLast;
};

}  // namespace Kdd
