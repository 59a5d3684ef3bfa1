#include "kddlib/tagfile/qa/QAJob.h"

#include "kddlib/tagfile/NodeAttributes.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/base/Stopwatch.h"
#include "platform/os/ExclusiveFile.h"
#include "platform/os/JournaledWrite.h"

#include <dcmtk/dcmdata/dcdeftag.h>

#include <algorithm>

namespace Kdd
{

namespace
{

const char* const kCategory = "TagFileQA";
const char* const kInBothStudies = "; until the job is run again its images may stand in both studies";

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

}  // namespace

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
    if (!prepare() || !claim() || !hold())
        return false;
    const int readMs = total.elapsed();
    const auto hasLabels = [](const TagFile& file) {
        return std::any_of(file.mSeries.cbegin(), file.mSeries.cend(), isLabelled);
    };
    mSourceHasLabels = hasLabels(mSource);
    mDestinationHasLabels = hasLabels(mDestination.isEmpty() ? mSource : mDestination);
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
    mMessage.clear();
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

// ---- holding the studies

/// Whoever builds a study claims it first and holds its file then.
bool TagFile::QAJob::claim()
{
    QString reason;
    const QARecord::Answer answer = mRecord.claim(mJob, reason);
    mJob.outcome.isLockedOut = answer == QARecord::Answer::Later;
    return answer == QARecord::Answer::Done || fail(reason);
}

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
    // Labels are distinct only among the series that were there when they were made.
    if (!mLeft.empty() && mDestinationHasLabels)
        mDestination.createAbstractTags();
    if (!mLeft.empty() && mSourceHasLabels)
        mSource.createAbstractTags();
    mDestination.optimizeAll();
}

bool TagFile::QAJob::record()
{
    QString reason;
    const QARecord::Answer answer = mRecord.record(reason);
    mJob.outcome.isLockedOut = answer == QARecord::Answer::Later;
    return answer == QARecord::Answer::Done || fail(reason);
}

/// The image database comes first: what it knows the next build makes, whatever becomes of this process. Of the files
/// the destination comes first: at every moment each image stands in the one study, in the other or in both.
bool TagFile::QAJob::write()
{
    tidy();
    if (!record())
        return false;
    QFile& file = mDestination.mCacheFile;
    const QString& path = mDestination.mCacheFilePath;
    if (!mDestination.isEmpty() && !mDestination.writeInto(file, path, false)) {
        if (mIsMove && hasJournal(path))
            return fail(mDestination.failure() + QLatin1String(kInBothStudies));
        return failWriting(mDestination.failure());
    }
    if (mIsMove && mSource.isEmpty()) {
        if (!mSource.writeCacheFile())
            return fail(mSource.failure() + QLatin1String(kInBothStudies));
    } else if (mIsMove && !mSource.writeInto(mSource.mCacheFile, mSource.mCacheFilePath, false)) {
        const QString failure = mSource.failure();
        const QString left = takeBack();
        return left.isEmpty() ? failWriting(failure) : fail(failure + left);
    }
    mRecord.finish(mDestination, mJob.studyUID);
    if (mIsMove)
        mRecord.finish(mSource, mJob.oldStudyUID);
    return true;
}

/// With the files as they were.
bool TagFile::QAJob::failWriting(const QString& reason)
{
    return fail(reason + mRecord.takeBack());
}

/// Makes the destination what it was, because the source could not be written. But what the source has a journal for
/// is a promise, and its images will leave it. Empty, or where the images stand then.
QString TagFile::QAJob::takeBack()
{
    QFile& file = mDestination.mCacheFile;
    const QString& path = mDestination.mCacheFilePath;
    if (hasJournal(mSource.mCacheFilePath))
        return QLatin1String(kInBothStudies);
    const QString reason = mBefore.isEmpty() ? removeWithJournal(file, path)
                                             : writeInPlace(file, path, mBefore, {flushing(), Tail::Cut});
    return QLatin1String(reason.isEmpty() ? "" : kInBothStudies);
}

}  // namespace Kdd
