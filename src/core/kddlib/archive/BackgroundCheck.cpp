#include "kddlib/archive/BackgroundCheck.h"

#include "kddlib/archive/StudyProof.h"
#include "platform/base/LogFile.h"
#include "platform/database/Kxg.h"
#include "platform/database/StudyProofs.h"

#include <QDateTime>

#include <algorithm>
#include <condition_variable>
#include <mutex>
#include <thread>

namespace Kdd
{

namespace
{

using Clock = std::chrono::steady_clock;
using std::chrono::milliseconds;

constexpr milliseconds kMostAway{30'000};

/// Somebody who works on a study makes its tag file anew, so it is not waited for him long [ms].
constexpr int kPatience = 1000;

/// Of one study so many faults are told: a disk that is out of reach is one fault and not a million lines.
constexpr int kMostTold = 20;

void tell(const QString& fault, int& told)
{
    if (++told <= kMostTold)
        LogFile::errorf("%s", qUtf8Printable(fault));
}

}  // namespace

struct BackgroundCheck::Private
{
    void work();
    Result step(bool& isIdle);
    Result check(Kxg::CheckedStudy study);
    void note(const StudyProof::Findings& findings, bool isDone);
    bool take(qint64 bytes);
    bool rest(milliseconds time);

    Pace pace;
    std::thread thread;
    std::unique_ptr<Kxg::Catalogue> catalogue;  // of that thread, and so are the next ones
    std::unique_ptr<Kxg::CheckTurn> turn;
    Clock::time_point due;  // when what was read is paid for
    Clock::time_point noteAt;

    mutable std::mutex mutex;  // of all below
    std::condition_variable changed;
    bool isStopped = false;
    Counts counts;
};

BackgroundCheck::BackgroundCheck(const Pace& pace)
    : d(std::make_unique<Private>())
{
    d->pace = pace;
}

BackgroundCheck::~BackgroundCheck()
{
    stop();
}

void BackgroundCheck::start()
{
    d->isStopped = false;
    d->thread = std::thread([this] { d->work(); });
}

void BackgroundCheck::stop()
{
    {
        const std::lock_guard<std::mutex> lock(d->mutex);
        d->isStopped = true;
        d->changed.notify_all();
    }
    if (d->thread.joinable())
        d->thread.join();
}

BackgroundCheck::Counts BackgroundCheck::counts() const
{
    const std::lock_guard<std::mutex> lock(d->mutex);
    return d->counts;
}

void BackgroundCheck::Private::work()
{
    milliseconds away = pace.away;
    bool isTold = false;
    while (rest(milliseconds(0))) {
        bool isIdle = false;
        const Result result = step(isIdle);
        if (result.bad()) {
            if (!isTold)
                LogFile::errorf("The look at the archive's files waits: %s", qUtf8Printable(result.text()));
            isTold = true;
            // The right may be lost with the connection.
            turn.reset();
            rest(away);
            away = std::min(2 * away, kMostAway);
            continue;
        }
        isTold = false;
        away = pace.away;
        if (isIdle)
            rest(pace.look);
    }
    // By the thread that made them.
    turn.reset();
    catalogue.reset();
}

Result BackgroundCheck::Private::step(bool& isIdle)
{
    Result result;
    if (catalogue == nullptr)
        catalogue = Kxg::Catalogue::openExisting(Kxg::DatabaseServer(), result);
    if (result.good())
        result = turn == nullptr ? catalogue->takeCheckTurn(turn) : turn->confirm();
    Kxg::CheckedStudy study;
    if (result.good() && turn != nullptr)
        result = catalogue->nextToCheck(QDateTime::currentMSecsSinceEpoch() - pace.again.count(), study);
    isIdle = study.studyInstanceUID.isEmpty();
    if (result.good() && !isIdle)
        result = check(study);
    // Also where another one is at work, so that it does not matter which server is asked.
    int faulty = 0;
    if (result.good())
        result = catalogue->countFaulty(faulty);
    const std::lock_guard<std::mutex> lock(mutex);
    counts.faulty = result.good() ? faulty : counts.faulty;
    return result;
}

Result BackgroundCheck::Private::check(Kxg::CheckedStudy study)
{
    int told = 0;
    const StudyProof::Rules rules = {pace.heals, pace.records, kPatience,
                                     [this](qint64 bytes) { return take(bytes); }};
    StudyProof proof(*catalogue, rules, [&](const QString& fault) { tell(fault, told); });
    const int before = study.faults;
    Result result;
    if (study.position.isEmpty())
        result = proof.checkTagFile(study.studyInstanceUID);
    bool isDone = false;
    while (result.good() && !isDone && rest(milliseconds(0))) {
        noteAt = Clock::now() + pace.note;
        result = proof.checkFiles(study.studyInstanceUID, study.position, isDone);
        study.faults = before + proof.findings().faults - proof.findings().healed;
        if (result.good())
            result = catalogue->noteCheck(study, isDone);
    }
    if (told > kMostTold)
        LogFile::errorf("Study %s: %d faults in all", study.studyInstanceUID.constData(), study.faults);
    note(proof.findings(), isDone);
    return result;
}

void BackgroundCheck::Private::note(const StudyProof::Findings& findings, bool isDone)
{
    const std::lock_guard<std::mutex> lock(mutex);
    counts.studies += isDone ? 1 : 0;
    counts.faults += findings.faults;
    counts.healed += findings.healed;
}

/// Waits as long as what was read costs. Between files, where nothing was, false too when it is time to note how far the
/// study has come.
bool BackgroundCheck::Private::take(qint64 bytes)
{
    {
        const std::lock_guard<std::mutex> lock(mutex);
        counts.bytes += bytes;
    }
    // What was not used of the rate before is gone.
    const auto now = Clock::now();
    if (bytes == 0 && now >= noteAt)
        return false;
    due = std::max(due, now) + std::chrono::microseconds(bytes * 1'000'000 / pace.bytesPerSecond);
    return rest(std::chrono::duration_cast<milliseconds>(due - now));
}

/// False when it is time to end, at once when it becomes so.
bool BackgroundCheck::Private::rest(milliseconds time)
{
    std::unique_lock<std::mutex> lock(mutex);
    return !changed.wait_for(lock, time, [this] { return isStopped; });
}

}  // namespace Kdd
