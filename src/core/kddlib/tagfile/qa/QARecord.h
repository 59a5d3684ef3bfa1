#pragma once

#include "kddlib/tagfile/ChangeFault.h"
#include "kddlib/tagfile/qa/ImageIdentity.h"
#include "kddlib/tagfile/qa/QAAudit.h"
#include "platform/base/Result.h"
#include "platform/database/Catalogue.h"

#include <QByteArray>
#include <QList>
#include <QMap>
#include <QVector>

#include <map>
#include <memory>
#include <vector>

namespace Kdd
{

class StudyTree;
struct QAData;

/// What a job did to one image.
struct QAImageChange
{
    QByteArray studyUID;  ///< where the image stood before the job
    QByteArray seriesUID;
    QByteArray key;
    AuditLog before;
    QVector<AuditChange> changes;

    const StudyTree* holder = nullptr;  ///< where it stands now; not owned
    QByteArray keyNow;
    bool wasThereAlready = false;  ///< an earlier run of the job that ended early had brought it there
    bool replacedAnother = false;  ///< an image of the same UID
};

/// The part of a correction that the image database keeps, so that later builds make it again. Without a database, or
/// when that knows none of the studies, there is nothing to be kept.
///
/// The studies stay claimed while the object lives: whoever builds one meanwhile would write what he read before.
class QARecord
{
public:
    ~QARecord();

    /// Claims the studies in the order in which tag files are held.
    Result claim(const QAData& job);

    /// Without claims, for whoever only asks whether `record` would do: the studies are others'.
    Result consult(const QAData& job);

    void note(const QAImageChange& change) { mChanges.push_back(change); }

    /// Keeps all that was noted, in one transaction. Not when the database knows of corrections that the tag files do
    /// not show yet.
    Result record();

    /// The same without keeping anything.
    Result plan();

    /// The image because of which nothing was recorded; empty: there is none.
    const QByteArray& refusedImage() const { return mRefusedImage; }

    /// Why `claim`, `consult`, `plan` or `record` failed: others only have to finish what they do, the database could not be
    /// asked or written, or `refusedImage` stands in the way.
    ChangeFault fault() const { return mFault; }

    /// Whether the database has something of the job, which `takeBack` would undo.
    bool isRecorded() const { return !mRecorded.empty(); }

    /// Makes what `record` did undone. On failure what was recorded stays.
    Result takeBack();

    /// To be called for each study when the tag files are written: the study does not wait for what was recorded, unless an
    /// image that had been replaced came to light. A fault is warned about, for the study is built once more then.
    void finish(const StudyTree& tree, const Kxg::TagFileStamp& stamp, const QByteArray& studyUID);

private:
    struct Study
    {
        std::unique_ptr<Kxg::StudyClaim> claim;
        bool isMade = false;        // for this job
        bool isRecognised = false;  // the tag file was the one that the database knows
        Kxg::StudyContents contents;
        std::vector<Kxg::ImageCorrection> corrections;
    };

    Result open(const QAData& job, QList<QByteArray>& uids, QVector<QByteArray>& known);
    Result claimOne(const QByteArray& studyUID, bool isDestination);
    Result lockedOut(const QString& reason);
    Result asked(const Result& result);
    Result read();
    bool identify(const QAImageChange& change, Kxg::ImageCorrection& former);
    bool identifyByLog(const QAImageChange& change, Kxg::ImageCorrection& former);
    const Kxg::ImageCorrection* findShown(const QByteArray& studyUID, const QByteArray& key,
                                          const AuditLog& log) const;
    const Kxg::ImageCorrection* find(const ImageIdentity& identity) const;
    Result add(const QAImageChange& change, const Kxg::ImageCorrection& former);
    bool uncovers(const StudyTree& tree, const QByteArray& studyUID);

    std::unique_ptr<Kxg::Catalogue> mCatalogue;  // null when nothing is to be kept
    std::map<QByteArray, Study> mStudies;        // those that are claimed
    std::vector<QAImageChange> mChanges;
    std::vector<Kxg::ImageCorrection> mRecorded;
    std::vector<Kxg::ImageCorrection> mFormer;
    QMap<QByteArray, qint64> mRequests;
    QByteArray mRefusedImage;
    bool mIsClaimed = false;
    bool mIsFinal = false;  // taking it back would do more than that
    ChangeFault mFault = ChangeFault::None;
};

}  // namespace Kdd
