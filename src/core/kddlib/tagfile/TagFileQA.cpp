#include "kddlib/Limits.h"
#include "kddlib/tagfile/QAEditor.h"
#include "kddlib/tagfile/QAVolumes.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/base/Stopwatch.h"
#include "platform/os/ExclusiveFile.h"
#include "platform/os/JournaledWrite.h"

#include <dcmtk/dcmdata/dcdeftag.h>

#include <algorithm>
#include <map>
#include <memory>
#include <set>
#include <utility>

namespace Kdd
{

namespace
{

const char* const kCategory = "TagFileQA";
const char* const kInBothStudies = "; until the job is run again its images may stand in both studies";

const DcmTagKey kAuditTime(0x0071, 0x0022);

/// What a study or a series says of itself and its images only inherit.
const DcmTagKey kOfTheNode[] = {kFromDatabase, kHasVolumeFile, kAbstract};

bool isOfTheNode(const DcmTagKey& key)
{
    return std::find(std::begin(kOfTheNode), std::end(kOfTheNode), key) != std::end(kOfTheNode);
}

/// Lets a node that was placed below others inherit what they say of themselves.
void inheritOfTheNode(TagMap& node)
{
    for (const DcmTagKey& key : kOfTheNode) {
        const TagElement* own = node.tagsForLevel().value(key, nullptr);
        if (own != nullptr && own->markedAsMissing())
            node.deleteElement(key);
    }
}

/// Whether the log tells already of the change at that time.
bool isNoted(const AuditLog& log, const QString& time, const AuditChange& change)
{
    QVector<AuditEntry> entries;
    log.decode(entries);
    return std::any_of(entries.cbegin(), entries.cend(), [&](const AuditEntry& entry) {
        return entry.time == time && entry.changes.contains(change);
    });
}

/// Whether `log` goes on where `before` ends, and with these changes: then its image is the corrected one.
bool isContinued(const AuditLog& before, const QVector<AuditChange>& changes, const AuditLog& log)
{
    QVector<AuditEntry> earlier;
    QVector<AuditEntry> entries;
    return log.text().startsWith(before.text()) && before.decode(earlier) && log.decode(entries) &&
           entries.size() > earlier.size() && entries.at(earlier.size()).changes == changes;
}

bool isLabelled(const TagMap* series)
{
    return series->findElement(kAbstract) != nullptr;
}

/// Whether an image inherits what the node holds.
bool isSeenBelow(const TagMap& node, const DcmTagKey& key)
{
    return std::any_of(node.children().begin(), node.children().end(), [&](const TagMap* child) {
        return !child->tagsForLevel().contains(key) &&
               (child->children().isEmpty() || isSeenBelow(*child, key));
    });
}

/// Markers that hide a value that is not there any more.
void forgetMarkersBelow(const TagMap& node, const DcmTagKey& key)
{
    for (TagMap* child : node.children()) {
        const TagElement* own = child->tagsForLevel().value(key, nullptr);
        if (own != nullptr && !own->markedAsMissing())
            continue;
        child->deleteElement(key);
        forgetMarkersBelow(*child, key);
    }
}

bool movesImages(const DcmTagKey& key)
{
    return key == DCM_StudyInstanceUID || key == DCM_SeriesInstanceUID || key == DCM_SOPInstanceUID;
}

}  // namespace

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

    bool move(const Edit& edit);
    bool isMovedAlready(const Edit& edit, const TagMap& there) const;
    void dropFromOrigin(const Edit& edit);
    bool place(const Edit& edit, TagFile& target, const QByteArray& newKey);
    QASeriesMove* takeVolumes(TagFile& file, TagMap& series);

    void tidy();
    bool write();
    bool takeBack();

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

    TagFile mDestination;
    TagFile mSource;
    QAData& mJob;
    QString& mMessage;
    bool mIsMove = false;
    bool mReordersImages = false;  // in volumes
    QString mTime;
    QByteArray mBefore;  // the destination's file, of a move
    qint64 mLogBytes = 0;
    std::map<Series, QASeriesMove> mMoves;  // the destination's first: its own volumes come before new ones
    std::set<Series> mLeft;                 // series that lost images
};

bool TagFile::applyQA(QAData& job, QString& message)
{
    return QAJob(job, message).run();
}

TagFile::QAJob::~QAJob()
{
    // What was made to be held and was not needed goes again before anyone else can open it.
    if (mDestination.mCacheFile.isOpen() && mDestination.mCacheFile.size() == 0)
        removeLocked(mDestination.mCacheFile, mDestination.mCacheFilePath);
}

bool TagFile::QAJob::run()
{
    const Stopwatch total;
    if (!prepare() || !hold())
        return false;
    const int readMs = total.elapsed();
    if (!applyToImages())
        return false;
    const Stopwatch writing;
    if ((mJob.outcome.changed > 0 || mJob.outcome.moved > 0) && !write())
        return false;
    const int optimiseMs = mDestination.mStatistics.optimiseMs;
    if (debugOption(kTimings)) {
        LogFile::tracef(
            1, kCategory, "%s: Total=%d Read=%d Optimize=%d Write=%d (%d images, %d changed, %d not found)",
            mIsMove ? "Move" : "Edit", total.elapsed(), readMs, optimiseMs, writing.elapsed() - optimiseMs,
            mJob.images.size(), mJob.outcome.changed, mJob.outcome.notFound.size());
    }
    return true;
}

bool TagFile::QAJob::prepare()
{
    mJob.outcome = {};
    if (mJob.oldStudyUID == mJob.studyUID)
        mJob.oldStudyUID.clear();
    mIsMove = !mJob.oldStudyUID.isEmpty();
    const QString reason = refusalOf(mJob);
    if (!reason.isEmpty())
        return fail(reason);
    auditTime(mJob.timestamp, mTime);
    if (!mJob.login.isEmpty())
        mTime += QLatin1Char(' ') + QString::fromLatin1(mJob.login);
    mReordersImages =
        std::any_of(mJob.substitutions.cbegin(), mJob.substitutions.cend(), [](const QASubstitution& each) {
            return movesImages(each.key) || each.key == DCM_InstanceNumber;
        });
    return true;
}

// ---- holding the files

/// All hold the files in the same order: two that each have what the other waits for would both give up.
bool TagFile::QAJob::hold()
{
    if (!mIsMove)
        return hold(mDestination, mJob.studyUID, IfAbsent::Fail);
    const bool isSourceFirst = cacheFilePathForStudy(mJob.oldStudyUID.constData()) <
                               cacheFilePathForStudy(mJob.studyUID.constData());
    if (isSourceFirst && !hold(mSource, mJob.oldStudyUID, IfAbsent::Fail))
        return false;
    // A study that is new is made at once, for others may be about to make it as well.
    if (!hold(mDestination, mJob.studyUID, IfAbsent::Create))
        return false;
    mDestination.mCacheFile.seek(0);
    mBefore = mDestination.mCacheFile.readAll();
    return isSourceFirst || hold(mSource, mJob.oldStudyUID, IfAbsent::Fail);
}

bool TagFile::QAJob::hold(TagFile& file, const QByteArray& studyUID, IfAbsent ifAbsent)
{
    if (file.holdStudy(studyUID, ifAbsent))
        return true;
    mJob.outcome.isLockedOut = file.wasLockedOut();
    return fail(QStringLiteral("The tag file of study %1 cannot be changed: %2")
                    .arg(QString::fromLatin1(studyUID),
                         file.wasLockedOut() ? QStringLiteral("others hold it") : file.failure()));
}

// ---- images

bool TagFile::QAJob::applyToImages()
{
    return std::all_of(mJob.images.cbegin(), mJob.images.cend(),
                       [this](const QByteArray& key) { return applyTo(key); });
}

bool TagFile::QAJob::applyTo(const QByteArray& key)
{
    TagMap* image = origin().findImage(key);
    if (image != nullptr)
        return applyTo(*image, key);
    // What an earlier run has moved is not missing.
    if (!mIsMove || mDestination.findImage(key) == nullptr)
        mJob.outcome.notFound.append(key);
    return true;
}

bool TagFile::QAJob::applyTo(TagMap& image, const QByteArray& key)
{
    Edit edit = {image, key, {}, {}};
    if (!edit.before.read(image))
        return failAt(key, QStringLiteral("its audit log is damaged"));
    if (mReordersImages)
        takeVolumes(origin(), *image.parent());
    const QString reason = substitute(edit);
    if (!reason.isEmpty())
        return failAt(key, reason);
    if (edit.changes.isEmpty())
        return true;
    if (!note(edit))
        return false;
    const bool isMoved = std::any_of(edit.changes.cbegin(), edit.changes.cend(),
                                     [](const AuditChange& change) { return movesImages(change.key); });
    return !isMoved || move(edit);
}

QString TagFile::QAJob::substitute(Edit& edit) const
{
    QAEditor editor(edit.image, mJob.substitutions);
    QString reason;
    for (int i = 0; i < mJob.substitutions.size() && reason.isEmpty(); ++i)
        reason = editor.substitute(mJob.substitutions.at(i));
    // Whoever moves a series to a study need not say that its images then belong to that study.
    if (reason.isEmpty() && mIsMove && editor.hasChanged(DCM_SeriesInstanceUID))
        reason = editor.substitute({DCM_StudyInstanceUID, QString::fromLatin1(mJob.studyUID)});
    for (const AuditChange& change : editor.changes()) {
        // Pixels cannot be looked at, so only the log tells that this job was here before.
        if (change.key != DCM_PixelData || !isNoted(edit.before, mTime, change))
            edit.changes.append(change);
    }
    return reason;
}

/// Tells the changes in the image's audit log.
bool TagFile::QAJob::note(Edit& edit)
{
    AuditLog log = edit.before;
    log.append({mTime, edit.changes});
    mLogBytes += log.text().size();
    if (mLogBytes > kMaxBodySize)
        return failAt(edit.key, QStringLiteral("the audit logs become too long to be stored"));
    if (!log.store(edit.image))
        return failAt(edit.key, QStringLiteral("there is no private block left for its audit log"));
    if (!mJob.timestamp.isEmpty() && !mJob.login.isEmpty())
        edit.image.putAndInsertValue(kAuditTime, kOurPrivateCreator, VrCode::DT, mJob.timestamp);
    ++mJob.outcome.changed;
    if (edit.hasChanged(DCM_PixelData) && edit.image.findElement(kPreview) != nullptr)
        renewPreview(edit);
    return true;
}

/// A picture of what was corrected away is worse than none.
void TagFile::QAJob::renewPreview(const Edit& edit)
{
    if (origin().addPreview(edit.key, QString::fromLocal8Bit(filePathOf(edit.image))))
        return;
    edit.image.deleteElement(kPreview);
    if (edit.image.findElement(kPreview) != nullptr)
        edit.image.markAsMissing(kPreview);
}

// ---- moving

/// Takes the volumes out of a series, once. Null when it has none.
QASeriesMove* TagFile::QAJob::takeVolumes(TagFile& file, TagMap& series)
{
    const Series key(&file, series.uid(TagMap::SeriesLevel));
    const auto found = mMoves.find(key);
    if (found != mMoves.end())
        return &found->second;
    if (series.volumes().isEmpty())
        return nullptr;
    return &mMoves.emplace(key, QAVolumes::takeOut(file, series)).first->second;
}

bool TagFile::QAJob::move(const Edit& edit)
{
    const bool staysInSeries =
        !edit.hasChanged(DCM_StudyInstanceUID) && !edit.hasChanged(DCM_SeriesInstanceUID);
    TagFile& target = staysInSeries ? origin() : mDestination;
    const QByteArray newKey = imageKey(edit.image);
    TagMap* there = target.findImage(newKey);
    ++mJob.outcome.moved;
    if (there == nullptr || there == &edit.image)
        return place(edit, target, newKey);
    if (isMovedAlready(edit, *there)) {
        dropFromOrigin(edit);
        return true;
    }
    if (edit.hasChanged(DCM_SOPInstanceUID))
        return failAt(edit.key, QStringLiteral("there is another image %1").arg(QString::fromLatin1(newKey)));
    LogFile::warnf("Image %s of study %s replaces the one that study %s had", newKey.constData(),
                   mJob.oldStudyUID.constData(), mJob.studyUID.constData());
    const QByteArray seriesUID = there->uid(TagMap::SeriesLevel);
    takeVolumes(target, *there->parent());
    mLeft.insert({&target, seriesUID});
    return place(edit, target, newKey);
}

/// An earlier run of the job may have ended when only the destination was written. What happened to the image there
/// since then stays.
bool TagFile::QAJob::isMovedAlready(const Edit& edit, const TagMap& there) const
{
    AuditLog log;
    return mIsMove && log.read(there) && isContinued(edit.before, edit.changes, log);
}

void TagFile::QAJob::dropFromOrigin(const Edit& edit)
{
    mLeft.insert({&origin(), edit.image.parent()->uid(TagMap::SeriesLevel)});
    delete origin().takeImage(edit.key);
}

bool TagFile::QAJob::place(const Edit& edit, TagFile& target, const QByteArray& newKey)
{
    TagMap& series = *edit.image.parent();
    const QByteArray seriesUID = series.uid(TagMap::SeriesLevel);
    if (QASeriesMove* volumes = takeVolumes(origin(), series))
        volumes->movedTo.insert(edit.key, newKey);
    mLeft.insert({&origin(), seriesUID});
    std::unique_ptr<TagMap> image(origin().takeImage(edit.key));
    for (const DcmTagKey& key : kOfTheNode)
        image->deleteElement(key);
    image->deleteElement(kVolumeIndex);
    TagMap* placed = target.addTagMap(image.release(), nullptr, true);
    if (placed == nullptr)
        return failAt(edit.key,
                      QStringLiteral("study %1 does not take it").arg(QString::fromLatin1(mJob.studyUID)));
    inheritOfTheNode(*placed);
    inheritOfTheNode(*placed->parent());
    return true;
}

// ---- writing

/// Removes what a node holds and no image below shows: it belonged to images that left.
void TagFile::forgetUnseen(TagMap& node)
{
    const QList<DcmTagKey> keys = node.tagsForLevel().keys();
    for (const DcmTagKey& key : keys) {
        if (isOfTheNode(key) || isSeenBelow(node, key))
            continue;
        node.deleteElement(key);
        if (node.findElement(key) == nullptr)
            forgetMarkersBelow(node, key);
    }
}

void TagFile::QAJob::tidy()
{
    for (auto& each : mMoves)
        mDestination.updateVolumesAfterQA(each.second);
    mSource.deleteEmptyNodes();
    mDestination.deleteEmptyNodes();
    for (const Series& each : mLeft) {
        if (TagMap* series = each.first->findSeries(each.second))
            forgetUnseen(*series);
        if (each.first->study() != nullptr)
            forgetUnseen(*each.first->study());
    }
    const QMap<QByteArray, TagMap*>& series = mDestination.mSeries;
    if (!mLeft.empty() && std::any_of(series.cbegin(), series.cend(), isLabelled))
        mDestination.createAbstractTags();
    mDestination.optimizeAll();
}

/// The destination comes first: at every moment each image stands in the one study, in the other or in both.
bool TagFile::QAJob::write()
{
    tidy();
    QFile& file = mDestination.mCacheFile;
    const QString& path = mDestination.mCacheFilePath;
    if (!mDestination.isEmpty() && !mDestination.writeInto(file, path, false))
        return fail(mDestination.failure() +
                    QLatin1String(mIsMove && hasJournal(path) ? kInBothStudies : ""));
    if (!mIsMove)
        return true;
    if (mSource.isEmpty())
        return mSource.writeCacheFile() || fail(mSource.failure() + QLatin1String(kInBothStudies));
    return mSource.writeInto(mSource.mCacheFile, mSource.mCacheFilePath, false) || takeBack();
}

/// Makes the destination what it was, because the source could not be written. But what the source has a journal for
/// is a promise, and its images will leave it.
bool TagFile::QAJob::takeBack()
{
    QFile& file = mDestination.mCacheFile;
    const QString& path = mDestination.mCacheFilePath;
    QString reason = QLatin1String(kInBothStudies);
    if (!hasJournal(mSource.mCacheFilePath))
        reason = mBefore.isEmpty() ? removeWithJournal(file, path)
                                   : writeInPlace(file, path, mBefore, {flushing(), Tail::Cut});
    return fail(mSource.failure() + QLatin1String(reason.isEmpty() ? "" : kInBothStudies));
}

}  // namespace Kdd
