#pragma once

#include "kddlib/tagfile/StoredStudy.h"
#include "kddlib/tagfile/qa/QAData.h"
#include "kddlib/tagfile/qa/QARecord.h"
#include "kddlib/tagfile/qa/QASeriesMove.h"

#include <algorithm>
#include <map>
#include <set>
#include <utility>

namespace Kdd
{

/// Whether an image with another value of the attribute belongs to another place.
bool movesImages(const DcmTagKey& key);

/// One run of a job over the files that it concerns. All of it happens in memory; the files are written at the end.
class QAJob
{
public:
    enum class Purpose {
        Apply,
        Preview,  ///< only the outcome is wanted: nothing is claimed, made or written
    };

    /// The job must outlive the object. What the run did, or would do, is told in its outcome.
    QAJob(QAData& job, Purpose purpose)
        : mJob(job)
        , mIsPreview(purpose == Purpose::Preview)
    {
    }

    ~QAJob();
    QAJob(const QAJob&) = delete;
    QAJob& operator=(const QAJob&) = delete;

    /// On failure both files are as they were, but where the fault is `Kept`, and of a move whose images stand in both
    /// studies, which the reason tells. As after the death of the process in the middle, running the job again completes it.
    Result run();

private:
    /// The correction of one image.
    struct Edit
    {
        TagMap& image;
        QByteArray key;  // under which its tag file holds it
        QByteArray seriesUID;
        AuditLog before;
        QVector<AuditChange> changes;

        bool hasChanged(const DcmTagKey& attribute) const
        {
            return std::any_of(changes.begin(), changes.end(),
                               [&](const AuditChange& change) { return change.key == attribute; });
        }
    };

    using Series = std::pair<StudyTree*, QByteArray>;

    Result attempt();
    Result prepare();
    Result open();
    Result hold();
    Result hold(StoredStudy& study, const QByteArray& studyUID, IfAbsent ifAbsent);
    Result look(StoredStudy& study, const QByteArray& studyUID);

    void selectImages();
    Result applyToImages();
    Result applyTo(const QByteArray& key);
    Result applyTo(TagMap& image, const QByteArray& key);
    Result substitute(Edit& edit) const;
    Result note(Edit& edit);
    void renewPreview(const Edit& edit);

    enum class There { Nothing, Another, TheSame };

    void keep(const Edit& edit, const StudyTree& holder, const QByteArray& keyNow, There there);
    Result move(const Edit& edit);
    bool isMovedAlready(const Edit& edit, const TagMap& there) const;
    void dropFromOrigin(const Edit& edit);
    Result place(const Edit& edit, StudyTree& target, const QByteArray& newKey);
    QASeriesMove* takeVolumes(StudyTree& tree, TagMap& series);

    void tidy();
    Result claim();
    Result recorded(const Result& result);
    Result write();
    Result writeSource();
    Result failWriting(const QString& reason);
    Result leaveKept(const QString& reason);
    bool takeBack();

    Result failAt(const QByteArray& key, const QString& reason)
    {
        mJob.outcome.refusedImage = key;
        return Result::failure(reason).within(QStringLiteral("Image %1").arg(QString::fromLatin1(key)));
    }

    StudyTree& origin() { return mIsMove ? mSource.tree() : mDestination.tree(); }

    QARecord mRecord;  // outlives the files: its claims go last
    StoredStudy mDestination;
    StoredStudy mSource;
    QAData& mJob;
    bool mIsPreview;
    bool mIsMove = false;
    bool mSourceHasLabels = false;
    bool mDestinationHasLabels = false;  // or a new one is to have them
    bool mReordersImages = false;        // in volumes
    QString mTime;
    QByteArray mBefore;         // the destination's file, of a move
    QList<QByteArray> mImages;  // that the job means
    qint64 mLogBytes = 0;
    std::map<Series, QASeriesMove> mMoves;  // the destination's first: its own volumes come before new ones
    std::set<Series> mLeft;                 // series that lost images
};

}  // namespace Kdd
