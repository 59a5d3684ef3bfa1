#include "kddlib/archive/StudyBuilders.h"

#include "kddlib/archive/ArchiveDatabase.h"
#include "kddlib/archive/StudyCompletion.h"
#include "kddlib/tagfile/StudyRecord.h"
#include "kddlib/tagfile/TagFile.h"

#include <thread>
#include <vector>

namespace Kdd
{

BuildTotals StudyBuilders::buildWaiting(int expected)
{
    return run(expected, [this](Kxg::Catalogue& catalogue) { workOnQueue(catalogue); });
}

BuildTotals StudyBuilders::build(const QVector<QByteArray>& studyUIDs)
{
    return run(studyUIDs.size(), [&](Kxg::Catalogue& catalogue) { workOnNamed(catalogue, studyUIDs); });
}

/// Each thread takes the next study when it is done with one, so that a large study holds nobody else up.
BuildTotals StudyBuilders::run(int expected, const std::function<void(Kxg::Catalogue&)>& work)
{
    mTotals = {};
    mExpected = expected;
    mNext = 0;
    std::vector<std::thread> workers;
    workers.reserve(static_cast<std::size_t>(mJobs));
    for (int i = 0; i < mJobs; ++i) {
        workers.emplace_back([&] {
            // Opened inside, for a connection belongs to the thread that opened it.
            if (const std::unique_ptr<Kxg::Catalogue> catalogue = openCatalogue())
                work(*catalogue);
            else
                fail();
        });
    }
    for (std::thread& worker : workers)
        worker.join();
    return mTotals;
}

void StudyBuilders::workOnQueue(Kxg::Catalogue& catalogue)
{
    while (!isCancelled()) {
        std::unique_ptr<Kxg::StudyClaim> claim;
        // What failed goes on waiting, and would be claimed again and again.
        if (!succeeded(catalogue.claimNext(failedStudies(), claim))) {
            fail();
            return;
        }
        // Others may still hold what waits; they will build it or leave it to the next run.
        if (claim == nullptr)
            return;
        build(catalogue, *claim);
    }
}

void StudyBuilders::workOnNamed(Kxg::Catalogue& catalogue, const QVector<QByteArray>& studyUIDs)
{
    for (int i = next(); i < studyUIDs.size() && !isCancelled(); i = next()) {
        std::unique_ptr<Kxg::StudyClaim> claim;
        if (succeeded(claimStudy(catalogue, studyUIDs.at(i), claim)))
            build(catalogue, *claim);
        else
            fail();
    }
}

void StudyBuilders::build(Kxg::Catalogue& catalogue, Kxg::StudyClaim& claim)
{
    const CompletedStudy completed = StudyCompletion(catalogue, mOptimize).build(claim);
    const bool isDone = succeeded(completed.result);
    const std::lock_guard<std::mutex> lock(mMutex);
    // A study that was removed is done, but not built.
    if (isDone) {
        mTotals.studies += completed.isRemoved ? 0 : 1;
        mTotals.images += completed.statistics.images;
        mTotals.volumes += completed.statistics.volumes;
    } else {
        ++mTotals.failed;
        mFailedStudies.insert(claim.studyId());
    }
    // Under the lock, because the observer is promised one call at a time. Others may have put studies into
    // the queue since they were counted, so the total follows.
    const int done = mTotals.studies + mTotals.failed;
    mObserver.progress(done, qMax(mExpected, done));
}

void StudyBuilders::fail()
{
    const std::lock_guard<std::mutex> lock(mMutex);
    ++mTotals.failed;
}

bool StudyBuilders::isCancelled()
{
    const std::lock_guard<std::mutex> lock(mMutex);
    return mObserver.isCancelled();
}

int StudyBuilders::next()
{
    const std::lock_guard<std::mutex> lock(mMutex);
    return mNext++;
}

QSet<int> StudyBuilders::failedStudies()
{
    const std::lock_guard<std::mutex> lock(mMutex);
    return mFailedStudies;
}

Result requestStale(Kxg::Catalogue& catalogue, bool everything)
{
    std::vector<Kxg::StudySummary> studies;
    Result listed = catalogue.listStudies(studies);
    if (listed.bad())
        return listed;
    QVector<QByteArray> stale;
    for (const Kxg::StudySummary& study : studies) {
        const QString path = TagFile::cacheFilePathForStudy(study.studyInstanceUID.constData());
        // What waits is in the queue already. Volume files alone have no tag file.
        if (!study.isWaiting && study.images > 0 && (everything || !isTagFile(path, study.tagFile)))
            stale.append(study.studyInstanceUID);
    }
    // Others may remove studies meanwhile.
    return stale.isEmpty() ? Result() : catalogue.requestBuild(stale, Kxg::Catalogue::IfGone::PassOver);
}

}  // namespace Kdd
