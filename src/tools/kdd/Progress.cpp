#include "tools/kdd/Progress.h"

#include <unistd.h>

#include <cstdio>

namespace Kdd
{

namespace
{

constexpr int kBarWidth = 30;
constexpr std::chrono::milliseconds kRedrawAfter(80);

}  // namespace

Progress::Progress(const char* what, bool isWanted)
    : mWhat(what)
    , mIsDrawn(isWanted && isatty(STDERR_FILENO) == 1)
{
}

Progress::~Progress()
{
    if (mIsDrawn)
        std::fprintf(stderr, "\r\033[K");
}

void Progress::show(qint64 done, qint64 total)
{
    const Clock::time_point now = Clock::now();
    if (!mIsDrawn || total <= 0 || (now - mLast < kRedrawAfter && done < total))
        return;
    mLast = now;
    const double seconds = std::chrono::duration<double>(now - mStart).count();
    const double rate = seconds > 0 ? static_cast<double>(done) / seconds : 0;
    const double left = rate > 0 ? static_cast<double>(total - done) / rate : 0;
    const QByteArray bar(static_cast<int>(kBarWidth * done / total), '#');
    std::fprintf(stderr, "\r\033[K%s [%-*s] %3d%%  %lld/%lld  %.0f/s  %.0f s left", mWhat, kBarWidth,
                 bar.constData(), static_cast<int>(100 * done / total), static_cast<long long>(done),
                 static_cast<long long>(total), rate, left);
}

}  // namespace Kdd
