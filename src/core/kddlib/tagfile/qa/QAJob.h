#pragma once

#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagfile/qa/QAEditor.h"
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
class TagFile::QAJob
{
public:
    QAJob(QAData& job, QString& message)
        : mJob(job)
        , mMessage(message)
    {
    }

    ~QAJob();
    QAJob(const QAJob&) = delete;
    QAJob& operator=(const QAJob&) = delete;

    bool run();

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

    using Series = std::pair<TagFile*, QByteArray>;

    bool prepare();
    bool hold();
    bool hold(TagFile& file, const QByteArray& studyUID, IfAbsent ifAbsent);

    bool applyToImages();
    bool applyTo(const QByteArray& key);
    bool applyTo(TagMap& image, const QByteArray& key);
    QString substitute(Edit& edit) const;
    bool note(Edit& edit);
    void renewPreview(const Edit& edit);

    enum class There { Nothing, Another, TheSame };

    void keep(const Edit& edit, const TagFile& holder, const QByteArray& keyNow, There there);
    bool move(const Edit& edit);
    bool isMovedAlready(const Edit& edit, const TagMap& there) const;
    void dropFromOrigin(const Edit& edit);
    bool place(const Edit& edit, TagFile& target, const QByteArray& newKey);
    QASeriesMove* takeVolumes(TagFile& file, TagMap& series);

    void tidy();
    bool claim();
    bool record();
    bool write();
    bool failWriting(const QString& reason);
    QString takeBack();

    bool fail(const QString& reason)
    {
        mMessage = reason;
        return false;
    }

    bool failAt(const QByteArray& key, const QString& reason)
    {
        return fail(QStringLiteral("Image %1: %2").arg(QString::fromLatin1(key), reason));
    }

    TagFile& origin() { return mIsMove ? mSource : mDestination; }

    QARecord mRecord;  // outlives the files: its claims go last
    TagFile mDestination;
    TagFile mSource;
    QAData& mJob;
    QString& mMessage;
    bool mIsMove = false;
    bool mSourceHasLabels = false;
    bool mDestinationHasLabels = false;  // or a new one is to have them
    bool mReordersImages = false;        // in volumes
    QString mTime;
    QByteArray mBefore;  // the destination's file, of a move
    qint64 mLogBytes = 0;
    std::map<Series, QASeriesMove> mMoves;  // the destination's first: its own volumes come before new ones
    std::set<Series> mLeft;                 // series that lost images
};

}  // namespace Kdd
