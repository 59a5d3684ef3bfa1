#include "kddlib/tagfile/TagFile.h"
#include "platform/base/LogFile.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/Database.h"
#include "tools/kdd/Progress.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/StudyBuild.h"

#include <QFileInfo>

#include <cstdio>
#include <mutex>
#include <thread>
#include <vector>

namespace Kdd
{

namespace
{

struct BuildTotals
{
    int studies = 0;
    int images = 0;
    int volumes = 0;
    int failed = 0;
};

/// What the workers of one process share. Each has a connection of its own; which study is whose the database decides,
/// among all processes.
class Builders
{
public:
    Builders(const GlobalOptions& options, const BuildRequest& request, int expected)
        : mRequest(request)
        , mExpected(expected)
        , mProgress("Building", !options.quiet)
    {
    }

    /// Builds waiting studies, or those named, until none is left.
    void work(const QVector<QByteArray>& named)
    {
        const std::unique_ptr<Kxg::Catalogue> database = openDatabase();
        if (database == nullptr) {
            fail();
            return;
        }
        if (mRequest.selection.studies.isEmpty())
            workOnQueue(*database);
        else
            workOnNamed(*database, named);
    }

    const BuildTotals& totals() const { return mTotals; }

private:
    void workOnQueue(Kxg::Catalogue& database)
    {
        while (true) {
            std::unique_ptr<Kxg::StudyClaim> claim;
            if (!succeeded(database.claimNext(failedStudies(), claim))) {
                fail();
                return;
            }
            if (claim == nullptr)
                return;
            build(*claim);
        }
    }

    void workOnNamed(Kxg::Catalogue& database, const QVector<QByteArray>& named)
    {
        for (int i = next(); i < named.size(); i = next()) {
            const std::unique_ptr<Kxg::StudyClaim> claim = claimStudy(database, named.at(i));
            if (claim != nullptr)
                build(*claim);
            else
                fail();
        }
    }

    void build(Kxg::StudyClaim& claim)
    {
        TagFile file;
        const bool isBuilt = buildStudy(claim, mRequest.optimize, file);
        const TagFile::Statistics statistics = file.statistics();
        const std::lock_guard<std::mutex> lock(mMutex);
        if (isBuilt) {
            ++mTotals.studies;
            mTotals.images += statistics.images;
            mTotals.volumes += statistics.volumes;
        } else {
            ++mTotals.failed;
            mFailedStudies.insert(claim.studyId());
        }
        mProgress.show(mTotals.studies + mTotals.failed, qMax(mExpected, mTotals.studies + mTotals.failed));
    }

    void fail()
    {
        const std::lock_guard<std::mutex> lock(mMutex);
        ++mTotals.failed;
    }

    int next()
    {
        const std::lock_guard<std::mutex> lock(mMutex);
        return mNext++;
    }

    QSet<int> failedStudies()
    {
        const std::lock_guard<std::mutex> lock(mMutex);
        return mFailedStudies;
    }

    const BuildRequest& mRequest;
    const int mExpected;
    std::mutex mMutex;
    Progress mProgress;
    BuildTotals mTotals;
    QSet<int> mFailedStudies;
    int mNext = 0;
};

/// With `everything` all studies, else those that have no tag file although nothing of them changed.
bool requestMissing(Kxg::Catalogue& database, bool everything)
{
    std::vector<Kxg::StudySummary> studies;
    if (!succeeded(database.listStudies(studies)))
        return false;
    QVector<QByteArray> missing;
    for (const Kxg::StudySummary& study : studies) {
        const QString path = TagFile::cacheFilePathForStudy(study.studyInstanceUID.constData());
        if (!study.isWaiting && (everything || QFileInfo(path).size() == 0))
            missing.append(study.studyInstanceUID);
    }
    return missing.isEmpty() || succeeded(database.requestBuild(missing));
}

void report(const GlobalOptions& options, const BuildTotals& totals)
{
    if (options.json) {
        printJson({{QStringLiteral("studies"), totals.studies},
                   {QStringLiteral("images"), totals.images},
                   {QStringLiteral("volumes"), totals.volumes},
                   {QStringLiteral("failed"), totals.failed}});
    } else if (!options.quiet) {
        std::printf("%d studies built with %d images and %d volumes, %d failed\n", totals.studies,
                    totals.images, totals.volumes, totals.failed);
    }
}

}  // namespace

Outcome runBuild(const GlobalOptions& options, const BuildRequest& request)
{
    if (request.selection.all && !request.selection.studies.isEmpty()) {
        LogFile::errorf("Name the studies to build, or --all");
        return Outcome::WrongUsage;
    }
    const std::unique_ptr<Kxg::Catalogue> database = openDatabase();
    QVector<QByteArray> named;
    int expected = 0;
    if (database == nullptr || !chooseStudies(*database, request.selection.studies, false, named) ||
        (request.selection.all && !requestMissing(*database, request.again)) ||
        !succeeded(database->countWaiting(expected)))
        return Outcome::Failed;
    BuildTotals totals;
    {
        Builders builders(options, request, named.isEmpty() ? expected : named.size());
        std::vector<std::thread> workers;
        workers.reserve(static_cast<std::size_t>(request.jobs));
        for (int i = 0; i < request.jobs; ++i)
            workers.emplace_back([&] { builders.work(named); });
        for (std::thread& worker : workers)
            worker.join();
        totals = builders.totals();
    }
    report(options, totals);
    return totals.failed == 0 ? Outcome::Done : Outcome::Failed;
}

}  // namespace Kdd
