#pragma once

#include "kddlib/archive/DicomInput.h"
#include "kddlib/archive/Registration.h"
#include "kddlib/archive/WorkObserver.h"
#include "kddlib/tagfile/TagFile.h"

#include <QMap>
#include <QSet>

#include <map>
#include <vector>

namespace Kdd
{

/// What is told of a study that was completed.
struct StudyTotals
{
    int series = 0;
    int images = 0;
    int volumes = 0;
    qint64 fileBytes = 0;    ///< of the files taken in
    qint64 headerBytes = 0;  ///< of these without their pixel data
    qint64 tagFileBytes = 0;
};

/// Takes files into the archive: registers them, and completes the tag files of all studies that they touch, also those
/// that they were taken from. Images are gathered by study, so that a study is completed once for all of them.
///
/// A file counts as taken once it is registered: whatever ends the process after that, its study waits in the queue.
/// Used by one thread.
class KDD_EXPORT StudyIntake
{
public:
    /// Both must outlive the object.
    StudyIntake(Kxg::Catalogue& catalogue, WorkObserver& observer);

    /// Failure: that of the database. A file that cannot be taken is logged and refused instead.
    Result take(DicomInput input);

    /// Completes all that was touched; when the observer cancels, the rest stays in the queue. Failure: that of the
    /// database. A study that cannot be completed is logged and refused instead.
    Result finish();

    /// Completes what an earlier intake registered below the paths without coming to the end of it.
    Result completeWaiting(const QList<QByteArray>& paths);

    /// By Study Instance UID.
    const QMap<QByteArray, StudyTotals>& studies() const { return mTotals; }

    /// Files that were not taken, and the studies that could not be completed, by path and UID.
    const std::vector<RefusedFile>& refused() const { return mRefused; }

private:
    /// A study whose images are being gathered.
    struct PendingStudy
    {
        TagFile file;
        int images = 0;
        qint64 lastTouched = 0;
        qint64 fileBytes = 0;
        qint64 headerBytes = 0;
    };

    using Pending = std::map<QByteArray, PendingStudy>;

    Result place(DicomInput& input);
    Result write(Pending::iterator study);
    Result writeLongestUntouched();
    void complete(const QByteArray& studyUID, PendingStudy* arrivals);

    Kxg::Catalogue& mCatalogue;
    WorkObserver& mObserver;
    Registration mRegistration;
    Pending mPending;
    QSet<QByteArray> mCompleted;
    QMap<QByteArray, StudyTotals> mTotals;
    std::vector<RefusedFile> mRefused;
    qint64 mClock = 0;
    int mPendingImages = 0;
};

}  // namespace Kdd
