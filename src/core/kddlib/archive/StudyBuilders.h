#pragma once

#include "kddlib/archive/WorkObserver.h"
#include "platform/base/Export.h"
#include "platform/base/Result.h"

#include <QByteArray>
#include <QSet>
#include <QVector>

#include <functional>
#include <mutex>

namespace Kxg
{
class Catalogue;
class StudyClaim;
}  // namespace Kxg

namespace Kdd
{

/// What builders have done.
struct BuildTotals
{
    int studies = 0;
    int images = 0;
    int volumes = 0;
    int failed = 0;
};

/// Builds tag files on several threads. Each has a connection of its own; which study is whose the database decides,
/// among all processes and machines that build.
class KDD_EXPORT StudyBuilders
{
public:
    /// `jobs` studies at once. Without `optimize` every attribute stays where it was found. The observer must outlive
    /// the object.
    StudyBuilders(WorkObserver& observer, int jobs, bool optimize = true)
        : mObserver(observer)
        , mJobs(jobs)
        , mOptimize(optimize)
    {
    }

    /// Builds what waits until nothing is left; what fails is tried once. `expected` is about how many will be built.
    BuildTotals buildWaiting(int expected);

    /// Builds the studies named, whether they wait or not.
    BuildTotals build(const QVector<QByteArray>& studyUIDs);

private:
    BuildTotals run(int expected, const std::function<void(Kxg::Catalogue&)>& work);
    void workOnQueue(Kxg::Catalogue& catalogue);
    void workOnNamed(Kxg::Catalogue& catalogue, const QVector<QByteArray>& studyUIDs);
    void build(Kxg::Catalogue& catalogue, Kxg::StudyClaim& claim);
    void fail();
    bool isCancelled();
    int next();
    QSet<int> failedStudies();

    WorkObserver& mObserver;
    const int mJobs;
    const bool mOptimize;
    std::mutex mMutex;  // of all below
    int mExpected = 0;
    BuildTotals mTotals;
    QSet<int> mFailedStudies;
    int mNext = 0;
};

/// Puts into the queue what has no tag file, a damaged one or one that is not what the catalogue believes it to be, as
/// after the restoring of a backup; with `everything` all studies. Failure: that of the database.
KDD_EXPORT Result requestStale(Kxg::Catalogue& catalogue, bool everything);

}  // namespace Kdd
