#include "server/dicomweb/store/ArrivalService.h"

#include <kddlib/ExResource.h>
#include <kddlib/LogFile.h>

#include <algorithm>

namespace Kdd::DicomWeb
{
namespace
{

/// So that a large study that is built holds no other one up.
constexpr int kThreads = 2;

/// How long to wait for another process that builds a study, before others have their turn [ms].
constexpr int kPatience = 2000;

/// Between attempts to reach the database.
constexpr auto kPause = std::chrono::seconds(1);

}  // namespace

std::unique_ptr<ArrivalService> ArrivalService::make(const ObjectRules& rules, const QByteArray& database,
                                                     Result& result)
{
    std::unique_ptr<ArrivalService> made(new ArrivalService(database));
    made->mStore = ObjectStore::open(rules, made->mStudies, result);
    return made->mStore != nullptr ? std::move(made) : nullptr;
}

ArrivalService::~ArrivalService()
{
    stop({});
}

void ArrivalService::start()
{
    mThreads.emplace_back([this] {
        prepare();
        work();
    });
    for (int i = 1; i < kThreads; ++i)
        mThreads.emplace_back([this] { work(); });
}

void ArrivalService::stop(std::chrono::milliseconds time)
{
    {
        const std::lock_guard<std::mutex> lock(mMutex);
        mIsStopped = true;
        mEnd = std::chrono::steady_clock::now() + time;
        mChanged.notify_all();
    }
    mStudies.stop();
    for (std::thread& thread : mThreads)
        thread.join();
    mThreads.clear();
}

/// Until the database answers.
void ArrivalService::prepare()
{
    bool isTold = false;
    while (true) {
        QVector<QByteArray> waiting;
        Result result = mDatabase.ask([&](Kxg::Catalogue& catalogue) {
            const Result recovered = mStore->recover(catalogue);
            return recovered.good() ? catalogue.waitingStudies(mStore->rules().folder, waiting) : recovered;
        });
        for (const QByteArray& study : qAsConst(waiting))
            mStudies.addWaiting(study);
        if (result.good())
            return;
        if (!isTold)
            LogFile::errorf("%s", qUtf8Printable(result.text()));
        isTold = true;
        std::unique_lock<std::mutex> lock(mMutex);
        if (mChanged.wait_for(lock, kPause, [this] { return mIsStopped; }))
            return;
    }
}

void ArrivalService::work()
{
    QByteArray study;
    while (mStudies.awaitDue(study)) {
        const Result result = complete(study, kPatience);
        if (result.bad())
            LogFile::warnf("Study %s is not complete yet: %s", study.constData(),
                           qUtf8Printable(result.text()));
    }
    for (const QByteArray& left : mStudies.waiting()) {
        if (std::chrono::steady_clock::now() < mEnd)
            complete(left, 0);
    }
}

Result ArrivalService::complete(const QByteArray& studyUID, int patienceMs)
{
    return mDatabase.ask(
        [&](Kxg::Catalogue& catalogue) { return mStudies.complete(studyUID, catalogue, patienceMs); });
}

Arrived ArrivalService::bringIn(const QByteArray& studyUID)
{
    // Asked in any case: another server may have taken it. Others may wait too, of which some thousand files were registered
    // that nobody waits for.
    bool isAwaited = false;
    const Result result = mDatabase.ask([&](Kxg::Catalogue& catalogue) {
        return catalogue.awaitsObjects(studyUID, mStore->rules().folder, isAwaited);
    });
    // Also where a thread completes the study now: it may have looked at what there was to do before this came.
    if (isAwaited)
        mStudies.addWaiting(studyUID);
    if (result.bad())
        return Arrived::Held;
    if (!mStudies.isWaiting(studyUID))
        return Arrived::Nothing;
    ArrivedStudies::Attempt attempt;
    const Result done = mDatabase.ask([&](Kxg::Catalogue& catalogue) {
        attempt = mStudies.attempt(studyUID, catalogue, ExResource::readPatience());
        return attempt.result;
    });
    if (done.good())
        return Arrived::Brought;
    LogFile::warnf("Study %s is not complete yet: %s", studyUID.constData(), qUtf8Printable(done.text()));
    return attempt.reachedFiles ? Arrived::Stuck : Arrived::Held;
}

bool ArrivalService::isRegistered(const QByteArray& studyUID, const QByteArray& sopInstanceUID)
{
    QVector<Kxg::KeptFile> files;
    const Result asked = mDatabase.ask(
        [&](Kxg::Catalogue& catalogue) { return catalogue.imageFiles(studyUID, sopInstanceUID, files); });
    return asked.good() && std::any_of(files.cbegin(), files.cend(), [&](const Kxg::KeptFile& file) {
               return file.isShown && file.shownStudyUID == studyUID && file.shownImage == sopInstanceUID;
           });
}

void ArrivalService::bringInOwn(const QByteArray& studyUID)
{
    if (!studyUID.isEmpty()) {
        if (mStudies.isWaiting(studyUID))
            complete(studyUID, ExResource::readPatience());
        return;
    }
    for (const QByteArray& study : mStudies.waiting())
        complete(study, ExResource::readPatience());
}

}  // namespace Kdd::DicomWeb
