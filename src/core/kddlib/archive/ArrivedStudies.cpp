#include "kddlib/archive/ArrivedStudies.h"

#include "kddlib/TagFileGenerator.h"
#include "kddlib/archive/ArchiveDatabase.h"
#include "kddlib/archive/Registration.h"
#include "kddlib/archive/StudyCompletion.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/database/StudyProofs.h"

#include <algorithm>
#include <condition_variable>
#include <map>
#include <mutex>
#include <vector>

namespace Kdd
{

namespace
{

using Clock = std::chrono::steady_clock;

/// Images held in memory, of some 10 KiB each. What goes beyond is read from its file when its study is completed.
constexpr int kMaxHeldImages = 20000;

// A study that others work on, or that cannot be completed, is tried again after so long, then after twice that: a disk that
// was full, or a database that was away, is noticed after no more than the time that it took once more.
constexpr auto kFirstPause = std::chrono::seconds(2);
constexpr std::chrono::seconds kLongestPause = std::chrono::hours(1);

// From then on its images are not held any more, but read from their files.
constexpr int kHeldFailures = 6;

// In a study that takes long to complete arrivals are gathered for so many times as long, so that the work stays in
// proportion to what arrives.
constexpr int kGatherTimes = 3;

Clock::duration pauseAfter(int failures)
{
    // No pause comes near to this many doublings.
    constexpr int kMostDoublings = 30;
    return std::min<Clock::duration>(kFirstPause * (1LL << std::min(failures - 1, kMostDoublings)),
                                     kLongestPause);
}

struct PendingStudy
{
    TagFile file;
    QVector<qint64> requests;  // those that registering these images left
    int images = 0;
    Clock::time_point due;
    Clock::time_point latest;  // up to which more images may put it off
};

struct Queued
{
    std::vector<DicomInput> images;
    QHash<QByteArray, QByteArray> digests;
    Result result;
    QSet<QByteArray> corrected;
    bool isDone = false;
};

}  // namespace

struct ArrivedStudies::Private
{
    Result registerQueued(Kxg::Catalogue& catalogue);
    void keepDigests(const Queued& registered);
    void recordDigests(Kxg::Catalogue& catalogue);
    void keep(DicomInput& image, const Registration& registration);
    PendingStudy& obtain(const QByteArray& studyUID);
    std::unique_ptr<PendingStudy> take(const QByteArray& studyUID);
    std::unique_ptr<PendingStudy> takeLocked(const QByteArray& studyUID);
    Attempt finish(const QByteArray& studyUID, Kxg::Catalogue& catalogue, int patienceMs);
    void conclude(const QByteArray& studyUID, bool isDone, Clock::duration time);

    Pace pace;

    // One transaction at a time, and none while it is decided what a completion takes in: an image that is registered but
    // not gathered would count as a change that nobody here knows of, for which a study is built as a whole.
    std::mutex registering;

    mutable std::mutex mutex;  // of all below; taken after the other one
    std::condition_variable changed;
    std::vector<Queued*> queued;
    std::vector<Kxg::FileDigest> digested;  // of registered files, and not kept yet
    std::map<QByteArray, std::unique_ptr<PendingStudy>> pending;
    QSet<QByteArray> running;
    QHash<QByteArray, int> failures;
    QHash<QByteArray, Clock::duration> took;  // of large studies, the last time
    int held = 0;
    bool isStopped = false;
};

// ---- what arrives

PendingStudy& ArrivedStudies::Private::obtain(const QByteArray& studyUID)
{
    std::unique_ptr<PendingStudy>& study = pending[studyUID];
    const Clock::time_point now = Clock::now();
    if (study == nullptr) {
        study = std::make_unique<PendingStudy>();
        const Clock::duration slow = kGatherTimes * took.value(studyUID);
        study->latest = now + std::max<Clock::duration>(pace.longest, slow);
    }
    study->due = std::min(now + pace.quiet, study->latest);
    return *study;
}

/// Registered images wait for their study, with what registering them left. A correction may have led one elsewhere;
/// then nothing was left here, and its file is read again there.
void ArrivedStudies::Private::keep(DicomInput& image, const Registration& registration)
{
    if (!registration.studies().contains(image.studyUID) || held >= kMaxHeldImages)
        return;
    PendingStudy& study = obtain(image.studyUID);
    const int before = study.file.imagesByUID().size();
    TagFileGenerator::place(study.file, std::move(image.map), image.path);
    const int added = study.file.imagesByUID().size() - before;
    study.images += added;
    held += added;
    for (const qint64 request : registration.requests(image.studyUID)) {
        if (!study.requests.contains(request))
            study.requests.append(request);
    }
}

void ArrivedStudies::Private::keepDigests(const Queued& registered)
{
    for (const DicomInput& image : registered.images) {
        const auto digest = registered.digests.constFind(image.path);
        if (digest != registered.digests.cend())
            digested.push_back({image.path, image.stamp, *digest, false});
    }
}

/// What dies before leaves files without a digest, which is told and can be mended.
void ArrivedStudies::Private::recordDigests(Kxg::Catalogue& catalogue)
{
    std::vector<Kxg::FileDigest> taken;
    {
        const std::lock_guard<std::mutex> lock(mutex);
        taken.swap(digested);
    }
    if (taken.empty())
        return;
    const Result result = catalogue.recordDigests(taken);
    if (result.bad())
        LogFile::warnf("%d files that arrived go without a digest: %s", static_cast<int>(taken.size()),
                       qUtf8Printable(result.text()));
}

/// All that wait, by whichever of their threads comes first.
Result ArrivedStudies::Private::registerQueued(Kxg::Catalogue& catalogue)
{
    std::vector<Queued*> taken;
    {
        const std::lock_guard<std::mutex> lock(mutex);
        taken.swap(queued);
    }
    Registration registration(catalogue);
    Result result;
    for (const Queued* each : taken) {
        for (const DicomInput& image : each->images)
            result = result.good() ? registration.add(image) : result;
    }
    if (result.good())
        result = registration.flushUndigested();
    const std::lock_guard<std::mutex> lock(mutex);
    const std::size_t before = pending.size();
    for (const QByteArray& studyUID : registration.studies())
        obtain(studyUID);
    for (Queued* each : taken) {
        if (result.good())
            keepDigests(*each);
        for (DicomInput& image : each->images) {
            if (result.good())
                keep(image, registration);
        }
        each->result = result;
        each->corrected = registration.corrected();
        each->isDone = true;
    }
    // What waits already is put off, and nobody has to be woken for that.
    if (pending.size() > before)
        changed.notify_all();
    return result;
}

ArrivedStudies::ArrivedStudies()
    : ArrivedStudies(Pace())
{
}

ArrivedStudies::ArrivedStudies(Pace pace)
    : d(std::make_unique<Private>())
{
    d->pace = pace;
}

ArrivedStudies::~ArrivedStudies() = default;

Result ArrivedStudies::add(std::vector<DicomInput> images, Kxg::Catalogue& catalogue,
                           QSet<QByteArray>& corrected)
{
    return add(std::move(images), {}, catalogue, corrected);
}

Result ArrivedStudies::add(std::vector<DicomInput> images, const QHash<QByteArray, QByteArray>& digests,
                           Kxg::Catalogue& catalogue, QSet<QByteArray>& corrected)
{
    Queued entry;
    entry.images = std::move(images);
    entry.digests = digests;
    {
        const std::lock_guard<std::mutex> lock(d->mutex);
        d->queued.push_back(&entry);
    }
    // While one registers the others wait here, and find that they were registered too or do it for all of them.
    const std::lock_guard<std::mutex> turn(d->registering);
    Result result = entry.isDone ? entry.result : d->registerQueued(catalogue);
    corrected = std::move(entry.corrected);
    return result;
}

void ArrivedStudies::addWaiting(const QByteArray& studyUID)
{
    const std::lock_guard<std::mutex> lock(d->mutex);
    d->obtain(studyUID).due = Clock::now();
    d->changed.notify_all();
}

// ---- what is due

bool ArrivedStudies::awaitDue(QByteArray& studyUID)
{
    std::unique_lock<std::mutex> lock(d->mutex);
    while (!d->isStopped) {
        auto next = d->pending.end();
        for (auto it = d->pending.begin(); it != d->pending.end(); ++it) {
            if (!d->running.contains(it->first) &&
                (next == d->pending.end() || it->second->due < next->second->due))
                next = it;
        }
        if (next == d->pending.end()) {
            d->changed.wait(lock);
        } else if (next->second->due <= Clock::now()) {
            studyUID = next->first;
            return true;
        } else {
            // Copied, for the study may be gone when the wait looks at it.
            const Clock::time_point due = next->second->due;
            d->changed.wait_until(lock, due);
        }
    }
    return false;
}

void ArrivedStudies::stop()
{
    const std::lock_guard<std::mutex> lock(d->mutex);
    d->isStopped = true;
    d->changed.notify_all();
}

bool ArrivedStudies::isWaiting(const QByteArray& studyUID) const
{
    const std::lock_guard<std::mutex> lock(d->mutex);
    return d->running.contains(studyUID) || d->pending.count(studyUID) > 0;
}

QList<QByteArray> ArrivedStudies::waiting() const
{
    const std::lock_guard<std::mutex> lock(d->mutex);
    QList<QByteArray> studies(d->running.begin(), d->running.end());
    for (const auto& study : d->pending) {
        if (!d->running.contains(study.first) && d->failures.value(study.first) < kHeldFailures)
            studies.append(study.first);
    }
    return studies;
}

// ---- completion

std::unique_ptr<PendingStudy> ArrivedStudies::Private::take(const QByteArray& studyUID)
{
    const std::lock_guard<std::mutex> lock(mutex);
    return takeLocked(studyUID);
}

std::unique_ptr<PendingStudy> ArrivedStudies::Private::takeLocked(const QByteArray& studyUID)
{
    const auto found = pending.find(studyUID);
    if (found == pending.end())
        return nullptr;
    std::unique_ptr<PendingStudy> study = std::move(found->second);
    held -= study->images;
    pending.erase(found);
    return study;
}

ArrivedStudies::Attempt ArrivedStudies::Private::finish(const QByteArray& studyUID, Kxg::Catalogue& catalogue,
                                                        int patienceMs)
{
    std::unique_ptr<Kxg::StudyClaim> claim;
    // Nothing has to be done for one that is gone.
    bool isThere = false;
    Result result = catalogue.findStudy(studyUID, isThere);
    if (result.bad() || !isThere) {
        if (result.good())
            take(studyUID);
        return {result};
    }
    result = catalogue.claim(studyUID, patienceMs, claim);
    if (result.good() && claim == nullptr)
        result = Result::failure(QStringLiteral("Study %1 is being worked on by another process")
                                     .arg(QString::fromUtf8(studyUID)));
    if (result.bad())
        return {result};
    StudyCompletion completion(catalogue);
    std::unique_ptr<PendingStudy> study;
    {
        const std::lock_guard<std::mutex> turn(registering);
        result = completion.read(*claim);
        study = take(studyUID);
    }
    // Others may have done it, and it is not done again for nothing.
    if (result.bad() || study == nullptr || !completion.isChanged())
        return {result};
    result = completion.completeRead(*claim, study->file, study->requests).result;
    return {result, result.bad()};
}

void ArrivedStudies::Private::conclude(const QByteArray& studyUID, bool isDone, Clock::duration time)
{
    const std::lock_guard<std::mutex> lock(mutex);
    running.remove(studyUID);
    took.remove(studyUID);
    if (isDone && time > pace.longest / kGatherTimes)
        took.insert(studyUID, time);
    const int count = isDone ? 0 : failures.value(studyUID) + 1;
    failures.remove(studyUID);
    if (count > 0) {
        failures.insert(studyUID, count);
        if (count == kHeldFailures) {
            LogFile::warnf("Study %s waits to be built", studyUID.constData());
            takeLocked(studyUID);
        }
        obtain(studyUID).due = Clock::now() + pauseAfter(count);
    }
    changed.notify_all();
}

ArrivedStudies::Attempt ArrivedStudies::attempt(const QByteArray& studyUID, Kxg::Catalogue& catalogue,
                                                int patienceMs)
{
    d->recordDigests(catalogue);
    {
        std::unique_lock<std::mutex> lock(d->mutex);
        const bool isFree = d->changed.wait_for(lock, std::chrono::milliseconds(patienceMs),
                                                [&] { return !d->running.contains(studyUID); });
        if (!isFree)
            return {Result::failure(
                QStringLiteral("Study %1 is being completed").arg(QString::fromUtf8(studyUID)))};
        if (d->pending.count(studyUID) == 0)
            return {};
        d->running.insert(studyUID);
    }
    const Clock::time_point began = Clock::now();
    Attempt attempt = d->finish(studyUID, catalogue, patienceMs);
    d->conclude(studyUID, attempt.result.good(), Clock::now() - began);
    return attempt;
}

Result ArrivedStudies::complete(const QByteArray& studyUID, Kxg::Catalogue& catalogue, int patienceMs)
{
    return attempt(studyUID, catalogue, patienceMs).result;
}

}  // namespace Kdd
