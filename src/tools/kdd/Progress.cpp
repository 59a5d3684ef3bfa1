#include "tools/kdd/Progress.h"

#include "tools/kdd/Report.h"

#include <unistd.h>

#include <cstdio>

namespace Kdd
{

namespace
{

constexpr int kBarWidth = 30;
// Often enough for the eye, and no cost to the work.
constexpr std::chrono::milliseconds kRedrawAfter(80);

}  // namespace

Progress::Progress(const char* what, bool isWanted, Unit unit)
    : mWhat(what)
    , mIsDrawn(isWanted && isatty(STDERR_FILENO) == 1)
    , mUnit(unit)
{
}

Progress::~Progress()
{
    // To the beginning of the line, and clear up to its end.
    if (mIsDrawn)
        std::fprintf(stderr, "\r\033[K");
}

QString Progress::countText(double count) const
{
    return mUnit == Unit::Bytes ? humanBytes(static_cast<qint64>(count)) : QString::number(count, 'f', 0);
}

void Progress::show(qint64 done, qint64 total)
{
    const Clock::time_point now = Clock::now();
    if (mFirst < 0)
        mFirst = done;
    // The last step is drawn in any case.
    if (!mIsDrawn || (now - mLast < kRedrawAfter && done != total))
        return;
    mLast = now;
    const double seconds = std::chrono::duration<double>(now - mStart).count();
    const double rate = seconds > 0 ? static_cast<double>(done - mFirst) / seconds : 0;
    const QString rateText = countText(rate) + QStringLiteral("/s");
    const QString doneText = countText(static_cast<double>(done));
    // Without a total there is neither a share nor an end to foretell.
    if (total <= 0) {
        std::fprintf(stderr, "\r\033[K%s %s  %s", mWhat, qUtf8Printable(doneText), qUtf8Printable(rateText));
        return;
    }
    const double left = rate > 0 ? static_cast<double>(total - done) / rate : 0;
    const QByteArray bar(static_cast<int>(kBarWidth * done / total), '#');
    std::fprintf(stderr, "\r\033[K%s [%-*s] %3d%%  %s/%s  %s  %.0f s left", mWhat, kBarWidth, bar.constData(),
                 static_cast<int>(100 * done / total), qUtf8Printable(doneText),
                 qUtf8Printable(countText(static_cast<double>(total))), qUtf8Printable(rateText), left);
}

}  // namespace Kdd
