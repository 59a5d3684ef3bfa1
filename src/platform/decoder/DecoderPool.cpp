#include "platform/decoder/DecoderPool.h"

#include "platform/os/ModuleFile.h"
#include "platform/os/PathName.h"

#include <QDir>
#include <QFileInfo>
#include <QStringList>
#include <QThread>

#include <unistd.h>

#include <algorithm>
#include <iterator>
#include <utility>

namespace Kdd
{
namespace
{

constexpr char kProgram[] = "kdd-decoder";

}  // namespace

DecoderPool::DecoderPool(QByteArray program, const DecoderLimits& limits)
    : mProgram(std::move(program))
    , mLimits(limits)
    , mMost(limits.count > 0 ? limits.count : std::max(1, QThread::idealThreadCount()))
    , mOwner(::getpid())
{
}

QByteArray DecoderPool::programOfProcess()
{
    const QStringList folders = moduleFolders();
    QString found;
    for (const QString& folder : folders) {
        const QString path = QDir(folder).absoluteFilePath(QLatin1String(kProgram));
        if (found.isEmpty() || (!QFileInfo::exists(found) && QFileInfo::exists(path)))
            found = path;
    }
    return pathBytes(found);
}

/// Never destroyed, because when the process ends other threads may still decode; its decoders end with it.
DecoderPool& DecoderPool::ofProcess()
{
    static auto* const pool = new DecoderPool(programOfProcess());
    return *pool;
}

Result DecoderPool::run(DecoderKind kind, const DecoderJob& job, DecoderMessage& answer)
{
    Result result;
    for (int attempt = 0; attempt < 2; ++attempt) {
        std::unique_ptr<DecoderProcess> process = lend(kind, result);
        if (process == nullptr)
            return result;
        const auto end = process->run(job, mLimits, answer, result);
        // What cannot be decoded may have left traces in it.
        const bool isReusable =
            end == DecoderProcess::End::Answered && result.good() && process->worked() < mLimits.life;
        if (!isReusable)
            process.reset();
        takeBack(std::move(process));
        if (end != DecoderProcess::End::Died)
            break;
    }
    return result;
}

int DecoderPool::count() const
{
    const std::lock_guard lock(mMutex);
    return mCount;
}

/// Those of the parent are its own, and so are the threads that they work for.
void DecoderPool::beginAnewAfterFork()
{
    if (mOwner == ::getpid())
        return;
    mOwner = ::getpid();
    mIdle.clear();
    mCount = 0;
}

std::unique_ptr<DecoderProcess> DecoderPool::lend(DecoderKind kind, Result& result)
{
    std::unique_ptr<DecoderProcess> other;
    {
        std::unique_lock lock(mMutex);
        beginAnewAfterFork();
        mIsFree.wait(lock, [&] { return !mIdle.empty() || mCount < mMost; });
        const auto found = std::find_if(mIdle.rbegin(), mIdle.rend(),
                                        [&](const auto& each) { return each->kind() == kind; });
        if (found != mIdle.rend()) {
            std::unique_ptr<DecoderProcess> process = std::move(*found);
            mIdle.erase(std::next(found).base());
            return process;
        }
        // One of another kind makes room where there is none.
        if (mCount < mMost) {
            ++mCount;
        } else {
            other = std::move(mIdle.front());
            mIdle.erase(mIdle.begin());
        }
    }
    other.reset();
    auto process = DecoderProcess::start(mProgram, kind, mLimits, result);
    if (process == nullptr)
        takeBack(nullptr);
    return process;
}

/// Null for one that has ended. Those that have rested end here, as there is no thread that waits for that alone.
void DecoderPool::takeBack(std::unique_ptr<DecoderProcess> process)
{
    std::vector<std::unique_ptr<DecoderProcess>> rested;
    {
        const std::lock_guard lock(mMutex);
        if (process != nullptr)
            mIdle.push_back(std::move(process));
        else
            --mCount;
        const auto since = DecoderChannel::Clock::now() - mLimits.rest;
        const auto end = std::find_if(mIdle.begin(), mIdle.end(),
                                      [&](const auto& each) { return each->restsSince() >= since; });
        std::move(mIdle.begin(), end, std::back_inserter(rested));
        mIdle.erase(mIdle.begin(), end);
        mCount -= static_cast<int>(rested.size());
    }
    mIsFree.notify_all();
}

}  // namespace Kdd
