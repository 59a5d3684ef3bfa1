#include "kddlib/archive/StudyWorkers.h"

#include "kddlib/archive/StudyCompletion.h"
#include "kddlib/tagfile/TagFile.h"
#include "platform/base/LogFile.h"
#include "platform/base/Stopwatch.h"
#include "platform/database/Kxg.h"
#include "platform/database/QueueNotices.h"
#include "platform/os/WakeSignal.h"

#include <algorithm>
#include <condition_variable>
#include <map>
#include <mutex>
#include <thread>
#include <vector>

namespace Kdd
{

namespace
{

using Clock = std::chrono::steady_clock;
using std::chrono::milliseconds;

// The longest pauses, of which each is twice the one before.
constexpr milliseconds kMostAway{30'000};
constexpr milliseconds kMostAgain{10 * 60'000};

/// After which the connection that hears is looked after, also when nothing is told [ms].
constexpr int kHearing = 60'000;

milliseconds longer(milliseconds pause, milliseconds most)
{
    return std::min(2 * pause, most);
}

struct Failure
{
    Clock::time_point again;
    milliseconds pause{0};
};

}  // namespace

struct StudyWorkers::Private
{
    void work();
    void hear();
    void complete(Kxg::Catalogue& catalogue, Kxg::StudyClaim& claim);
    void note(int study, const Result& result);
    void tellReach(const Result& result);
    QSet<int> resting();
    bool rest(milliseconds time);
    void awaitWork(quint64 known);
    quint64 countNotices();
    void notice();

    int jobs = 1;
    Pace pace;
    bool isServer = false;
    Kxg::DatabaseAddress address;
    std::vector<std::thread> threads;
    std::unique_ptr<WakeSignal> wake;  // of the one who waits for the server and not below

    mutable std::mutex mutex;  // of all below
    std::condition_variable changed;
    bool isStopped = false;
    bool isAway = false;  // the database, which was told
    quint64 notices = 0;
    int completed = 0;
    std::map<int, Failure> failures;  // by study id
};

StudyWorkers::StudyWorkers(int jobs)
    : StudyWorkers(jobs, Pace())
{
}

StudyWorkers::StudyWorkers(int jobs, Pace pace)
    : d(std::make_unique<Private>())
{
    d->jobs = jobs;
    d->pace = pace;
}

StudyWorkers::~StudyWorkers()
{
    stop();
}

void StudyWorkers::start()
{
    // One that cannot be understood is told of by those who want to open it.
    d->isServer = Kxg::DatabaseAddress::parse(Kxg::DatabaseServer(), d->address).good() &&
                  d->address.engine == Kxg::DatabaseAddress::Engine::Postgres;
    d->isStopped = false;
    d->wake = std::make_unique<WakeSignal>();
    for (int i = 0; i < d->jobs; ++i)
        d->threads.emplace_back([this] { d->work(); });
    if (d->isServer)
        d->threads.emplace_back([this] { d->hear(); });
}

void StudyWorkers::stop()
{
    {
        const std::lock_guard<std::mutex> lock(d->mutex);
        d->isStopped = true;
        d->changed.notify_all();
    }
    if (d->wake != nullptr)
        d->wake->wake();
    for (std::thread& thread : d->threads)
        thread.join();
    d->threads.clear();
}

int StudyWorkers::completed() const
{
    const std::lock_guard<std::mutex> lock(d->mutex);
    return d->completed;
}

// ---- working

void StudyWorkers::Private::work()
{
    // Opened inside, for a connection belongs to the thread that opened it; and kept, for it opens itself anew.
    std::unique_ptr<Kxg::Catalogue> catalogue;
    milliseconds away = pace.away;
    // No pause between studies: whether it is over is asked before each.
    while (rest(milliseconds(0))) {
        // What is told from here on is seen by the next look.
        const quint64 known = countNotices();
        Result result;
        std::unique_ptr<Kxg::StudyClaim> claim;
        if (catalogue == nullptr)
            catalogue = Kxg::Catalogue::openExisting(Kxg::DatabaseServer(), result);
        if (result.good())
            result = catalogue->claimRested(resting(), static_cast<int>(pace.arrivals.count()), claim);
        tellReach(result);
        if (result.bad()) {
            rest(away);
            away = longer(away, kMostAway);
            continue;
        }
        away = pace.away;
        if (claim != nullptr)
            complete(*catalogue, *claim);
        else
            awaitWork(known);
    }
}

void StudyWorkers::Private::complete(Kxg::Catalogue& catalogue, Kxg::StudyClaim& claim)
{
    const Stopwatch watch;
    TagFile arrivals;  // none are at hand
    const CompletedStudy study = StudyCompletion(catalogue).complete(claim, arrivals, {});
    note(claim.studyId(), study.result);
    if (study.result.bad())
        LogFile::errorf("%s", qUtf8Printable(study.result.text()));
    else if (study.isRemoved)
        LogFile::printf("Study %s has no images any more", claim.studyInstanceUID().constData());
    else
        LogFile::printf("Study %s is complete with %d images, in %d ms", claim.studyInstanceUID().constData(),
                        study.statistics.images, watch.elapsed());
}

/// A study that cannot be completed, because a file is out of reach or the disk is full, must not keep anybody busy.
void StudyWorkers::Private::note(int study, const Result& result)
{
    const std::lock_guard<std::mutex> lock(mutex);
    if (result.good()) {
        failures.erase(study);
        ++completed;
        return;
    }
    Failure& failure = failures[study];
    failure.pause = failure.pause.count() == 0 ? pace.again : longer(failure.pause, kMostAgain);
    failure.again = Clock::now() + failure.pause;
}

QSet<int> StudyWorkers::Private::resting()
{
    const std::lock_guard<std::mutex> lock(mutex);
    QSet<int> studies;
    for (const auto& failure : failures) {
        if (failure.second.again > Clock::now())
            studies.insert(failure.first);
    }
    return studies;
}

/// Once when it goes and once when it comes back, however many ask.
void StudyWorkers::Private::tellReach(const Result& result)
{
    const std::lock_guard<std::mutex> lock(mutex);
    if (result.bad() && !isAway)
        LogFile::errorf("Waiting for the database: %s", qUtf8Printable(result.text()));
    if (result.good() && isAway)
        LogFile::printf("The database answers again");
    isAway = result.bad();
}

// ---- waiting

/// False when it is time to end, at once when it becomes so.
bool StudyWorkers::Private::rest(milliseconds time)
{
    std::unique_lock<std::mutex> lock(mutex);
    return !changed.wait_for(lock, time, [this] { return isStopped; });
}

void StudyWorkers::Private::awaitWork(quint64 known)
{
    std::unique_lock<std::mutex> lock(mutex);
    changed.wait_for(lock, isServer ? pace.look : pace.lookFile,
                     [&] { return isStopped || notices != known; });
}

quint64 StudyWorkers::Private::countNotices()
{
    const std::lock_guard<std::mutex> lock(mutex);
    return notices;
}

void StudyWorkers::Private::notice()
{
    const std::lock_guard<std::mutex> lock(mutex);
    ++notices;
    changed.notify_all();
}

/// What it cannot hear is found by looking, so that the ones who look tell of a database that is away.
void StudyWorkers::Private::hear()
{
    milliseconds away = pace.away;
    while (rest(milliseconds(0))) {
        Result result;
        const std::unique_ptr<Kxg::QueueNotices> ear = Kxg::QueueNotices::open(address, *wake, result);
        if (ear == nullptr) {
            rest(away);
            away = longer(away, kMostAway);
            continue;
        }
        away = pace.away;
        // Something may have been told while nobody heard it.
        notice();
        auto heard = Kxg::QueueNotices::Heard::Nothing;
        while (rest(milliseconds(0)) && heard != Kxg::QueueNotices::Heard::Loss) {
            heard = ear->await(kHearing);
            if (heard == Kxg::QueueNotices::Heard::Work)
                notice();
        }
    }
}

}  // namespace Kdd
