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
    enum class Unit { Pieces, Bytes };

    Progress(const char* what, bool isWanted, Unit unit = Unit::Pieces);
    ~Progress();
    Progress(const Progress&) = delete;
    Progress& operator=(const Progress&) = delete;

    /// A total of 0 is one that is not known.
    void show(qint64 done, qint64 total);

private:
    using Clock = std::chrono::steady_clock;

    QString countText(double count) const;

    const char* mWhat;
    bool mIsDrawn;
    Unit mUnit;
    Clock::time_point mStart = Clock::now();
    Clock::time_point mLast;
    qint64 mFirst = -1;  // what was there before, which says nothing of the rate
};

}  // namespace Kdd
