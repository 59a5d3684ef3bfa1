#include "platform/database/AnswerWatch.h"

#include <QLibrary>

#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <condition_variable>
#include <map>
#include <mutex>
#include <set>
#include <thread>

namespace Kxg
{
namespace
{

using Clock = std::chrono::steady_clock;

/// The socket of PostgreSQL's client library, which is there when its driver has loaded it; -1 when there is none. A copy:
/// the number of the driver's own might be another file's by the time it is shut down.
int socketOf(const QVariant& handle)
{
    if (qstrcmp(handle.typeName(), "PGconn*") != 0)
        return -1;
    using SocketOf = int (*)(const void*);
    static const auto kSocketOf =
        reinterpret_cast<SocketOf>(QLibrary(QStringLiteral("pq"), 5).resolve("PQsocket"));
    const void* connection = *static_cast<void* const*>(handle.constData());
    if (kSocketOf == nullptr || connection == nullptr)
        return -1;
    // Not handed on to programs that are started meanwhile: the server gives back what a connection held when the last
    // one closes it.
    return fcntl(kSocketOf(connection), F_DUPFD_CLOEXEC, 0);
}

}  // namespace

struct AnswerWatch::Watched
{
    int socket = -1;
    Clock::time_point end = Clock::time_point::max();  // of the wait; the last: there is none
    bool hasEnded = false;
};

/// The thread that looks after the waits, with what it knows of them.
class AnswerWatch::Watcher
{
public:
    static Watcher& only()
    {
        static Watcher sWatcher;
        return sWatcher;
    }

    void add(Watched& watched)
    {
        const std::lock_guard<std::mutex> lock(mMutex);
        mAll.insert(&watched);
        if (!mThread.joinable())
            mThread = std::thread([this] { watch(); });
    }

    void remove(Watched& watched)
    {
        const std::lock_guard<std::mutex> lock(mMutex);
        mAll.erase(&watched);
    }

    void begin(Watched& watched, Seconds most)
    {
        const std::lock_guard<std::mutex> lock(mMutex);
        watched.end = Clock::now() + most;
        // Mostly the thread wakes earlier anyway, for a wait that ended long ago.
        if (watched.end < mWakes) {
            mWakes = watched.end;
            mChanged.notify_one();
        }
    }

    void end(Watched& watched)
    {
        const std::lock_guard<std::mutex> lock(mMutex);
        watched.end = Clock::time_point::max();
    }

    bool hasEnded(const Watched& watched)
    {
        const std::lock_guard<std::mutex> lock(mMutex);
        return watched.hasEnded;
    }

private:
    Watcher() = default;
    ~Watcher()
    {
        {
            const std::lock_guard<std::mutex> lock(mMutex);
            mIsOver = true;
            mChanged.notify_one();
        }
        if (mThread.joinable())
            mThread.join();
    }

    void watch()
    {
        std::unique_lock<std::mutex> lock(mMutex);
        while (!mIsOver) {
            const Clock::time_point now = Clock::now();
            mWakes = Clock::time_point::max();
            for (Watched* each : mAll) {
                if (each->end <= now) {
                    each->hasEnded = true;
                    each->end = Clock::time_point::max();
                    ::shutdown(each->socket, SHUT_RDWR);
                }
                mWakes = std::min(mWakes, each->end);
            }
            // Not until the last moment there is, which some clocks below cannot express.
            if (mWakes == Clock::time_point::max())
                mChanged.wait(lock);
            else
                mChanged.wait_until(lock, mWakes);
        }
    }

    std::mutex mMutex;
    std::condition_variable mChanged;
    std::set<Watched*> mAll;
    Clock::time_point mWakes = Clock::time_point::max();
    bool mIsOver = false;
    std::thread mThread;
};

AnswerWatch::AnswerWatch(const QVariant& handle)
{
    const int socket = socketOf(handle);
    if (socket < 0)
        return;
    mWatched = std::make_unique<Watched>();
    mWatched->socket = socket;
    Watcher::only().add(*mWatched);
}

AnswerWatch::~AnswerWatch()
{
    if (!mWatched)
        return;
    Watcher::only().remove(*mWatched);
    ::close(mWatched->socket);
}

AnswerWatch::Wait::Wait(AnswerWatch& watch, Seconds most)
    : mWatch(watch)
{
    if (mWatch.mWatched && most.count() > 0)
        Watcher::only().begin(*mWatch.mWatched, most);
}

AnswerWatch::Wait::~Wait()
{
    if (mWatch.mWatched)
        Watcher::only().end(*mWatch.mWatched);
}

bool AnswerWatch::hasEnded() const
{
    return mWatched && Watcher::only().hasEnded(*mWatched);
}

// ---- servers that stand still

namespace
{

constexpr std::chrono::seconds kRest(5);

// Longer than any attempt takes that does not come back.
constexpr std::chrono::seconds kAttempt(60);

std::mutex sMutex;

/// Until when nobody asks.
std::map<QByteArray, Clock::time_point>& silentUntil()
{
    static std::map<QByteArray, Clock::time_point> sSilent;
    return sSilent;
}

}  // namespace

bool SilentServers::mayAsk(const QByteArray& address)
{
    const std::lock_guard<std::mutex> lock(sMutex);
    const auto found = silentUntil().find(address);
    if (found == silentUntil().end())
        return true;
    if (Clock::now() < found->second)
        return false;
    // The others go on waiting until this one knows.
    found->second = Clock::now() + kAttempt;
    return true;
}

void SilentServers::noteSilence(const QByteArray& address)
{
    const std::lock_guard<std::mutex> lock(sMutex);
    silentUntil()[address] = Clock::now() + kRest;
}

void SilentServers::noteAnswer(const QByteArray& address)
{
    const std::lock_guard<std::mutex> lock(sMutex);
    silentUntil().erase(address);
}

}  // namespace Kxg
