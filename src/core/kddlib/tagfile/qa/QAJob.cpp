#include "kddlib/tagfile/qa/QAJob.h"

#include "kddlib/tagfile/NodeAttributes.h"
#include "kddlib/tagfile/SeriesLabels.h"
#include "kddlib/tagfile/qa/QAEditor.h"
#include "kddlib/tagfile/qa/QAVolumes.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/base/Stopwatch.h"
#include "platform/os/FileStatus.h"

#include <dcmtk/dcmdata/dcdeftag.h>

#include <algorithm>

namespace Kdd
{

namespace
{

const char* const kCategory = "TagFileQA";
const char* const kInBothStudies = "until the job is run again its images may stand in both studies";
const char* const kUntilBuilt = "until these are built its images may stand in both studies";
const char* const kPromised = "whoever opens the tag file next makes it";

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

/// Removes what a node holds and no image below shows: it belonged to images that left.
void forgetUnseen(TagMap& node)
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

}  // namespace

QAJob::~QAJob()
{
    // What was made to be held and was not needed goes again before anyone else can open it.
    mDestination.file().removeIfNeverWritten();
}

Result QAJob::run()
{
    Result result = attempt();
    if (result.bad() && mJob.outcome.fault == ChangeFault::None)
        mJob.outcome.fault = ChangeFault::Failed;
    return result;
}

Result QAJob::attempt()
{
    const Stopwatch total;
    Result result = prepare();
    if (result.good())
        result = open();
    if (result.bad())
        return result;
    const int readMs = total.elapsed();
    mSourceHasLabels = hasLabels(mSource.tree());
    // A study that the move makes follows the one that its images come from.
    mDestinationHasLabels = hasLabels(mDestination.tree().isEmpty() ? mSource.tree() : mDestination.tree());
    selectImages();
    result = applyToImages();
    if (result.bad())
        mJob.outcome.fault = ChangeFault::Refused;
    const Stopwatch writing;
    if (result.good() && (mJob.outcome.changed > 0 || mJob.outcome.moved > 0))
        result = mIsPreview ? recorded(mRecord.plan()) : write();
    if (result.bad())
        return result;
    if (mIsPreview)
        return result;
    const int optimiseMs = mDestination.figures().optimiseMs;
    if (TagFileSettings::debugOption(TagFileSettings::kTimings)) {
        LogFile::tracef(
            1, kCategory, "%s: Total=%d Read=%d Optimize=%d Write=%d (%d images, %d changed, %d not found)",
            mIsMove ? "Move" : "Edit", total.elapsed(), readMs, optimiseMs, writing.elapsed() - optimiseMs,
            mImages.size(), mJob.outcome.changed, mJob.outcome.notFound.size());
    }
    return {};
}

Result QAJob::prepare()
{
    mJob.outcome = {};
    // A move inside one study is an edit: two locks on one file would never be had.
    if (mJob.oldStudyUID == mJob.studyUID)
        mJob.oldStudyUID.clear();
    mIsMove = !mJob.oldStudyUID.isEmpty();
    Result result = check(mJob);
    if (result.bad()) {
        mJob.outcome.fault = ChangeFault::Refused;
        return result;
    }
    auditTime(mJob.timestamp, mTime);
    if (!mJob.login.isEmpty())
        mTime += QLatin1Char(' ') + QString::fromLatin1(mJob.login);
    // Instance Number decides the order of images in volumes, and UIDs where they belong.
    mReordersImages =
        std::any_of(mJob.substitutions.cbegin(), mJob.substitutions.cend(), [](const QASubstitution& each) {
            return movesImages(each.key) || each.key == DCM_InstanceNumber;
        });
    return result;
}

// ---- holding the studies

/// Whoever builds a study claims it first and holds its file then. Who only looks leaves both to others.
Result QAJob::open()
{
    Result result = mIsPreview ? mRecord.consult(mJob) : mRecord.claim(mJob);
    mJob.outcome.fault = mRecord.fault();
    if (result.good() && !mIsPreview)
        return hold();
    if (result.good())
        result = look(mDestination, mJob.studyUID);
    if (result.good() && mIsMove)
        result = look(mSource, mJob.oldStudyUID);
    return result;
}

/// A study without file has no images.
Result QAJob::look(StoredStudy& study, const QByteArray& studyUID)
{
    const QString path = TagFileSettings::cacheFilePathForStudy(studyUID.constData());
    if (presenceOf(path) == FilePresence::Absent)
        return {};
    const Result read = study.read(path, studyUID.constData(), false, StoredStudy::Reader::Serving);
    if (read.good() || presenceOf(path) == FilePresence::Absent)
        return {};
    if (study.wasLockedOut())
        mJob.outcome.fault = ChangeFault::LockedOut;
    return read.within(
        QStringLiteral("The tag file of study %1 cannot be read").arg(QString::fromLatin1(studyUID)));
}

/// All hold the files in the same order: two that each have what the other waits for would both give up.
Result QAJob::hold()
{
    if (!mIsMove)
        return hold(mDestination, mJob.studyUID, IfAbsent::Fail);
    const bool isSourceFirst = TagFileSettings::cacheFilePathForStudy(mJob.oldStudyUID.constData()) <
                               TagFileSettings::cacheFilePathForStudy(mJob.studyUID.constData());
    Result result;
    if (isSourceFirst)
        result = hold(mSource, mJob.oldStudyUID, IfAbsent::Fail);
    // A study that is new is made at once, for others may be about to make it as well.
    if (result.good())
        result = hold(mDestination, mJob.studyUID, IfAbsent::Create);
    if (result.bad())
        return result;
    // To be put back when the source cannot be written, for then the images must not stand here as well.
    mBefore = mDestination.file().content();
    return isSourceFirst ? result : hold(mSource, mJob.oldStudyUID, IfAbsent::Fail);
}

Result QAJob::hold(StoredStudy& study, const QByteArray& studyUID, IfAbsent ifAbsent)
{
    Result held = study.hold(studyUID, ifAbsent);
    if (held.good())
        return held;
    if (study.wasLockedOut())
        mJob.outcome.fault = ChangeFault::LockedOut;
    return held.within(
        QStringLiteral("The tag file of study %1 cannot be changed").arg(QString::fromLatin1(studyUID)));
}

// ---- writing

/// Brings both trees into the state in which they are written.
void QAJob::tidy()
{
    // Volumes first: they may give images to a series that is empty so far.
    for (auto& each : mMoves)
        QAVolumes::giveBack(mDestination.tree(), each.second);
    mSource.tree().deleteEmptyNodes();
    mDestination.tree().deleteEmptyNodes();
    for (const Series& each : mLeft) {
        if (TagMap* series = each.first->findSeries(each.second))
            forgetUnseen(*series);
        if (each.first->study() != nullptr)
            forgetUnseen(*each.first->study());
    }
    if (!mLeft.empty() && mDestinationHasLabels)
        createLabels(mDestination.tree());
    if (!mLeft.empty() && mSourceHasLabels)
        createLabels(mSource.tree());
    mDestination.optimizeAll();
}

/// What became of keeping the changes.
Result QAJob::recorded(const Result& result)
{
    mJob.outcome.fault = mRecord.fault();
    mJob.outcome.refusedImage = mRecord.refusedImage();
    return result;
}

/// The image database comes first: what it knows the next build makes, whatever becomes of this process. Of the files
/// the destination comes first: at every moment each image stands in the one study, in the other or in both.
Result QAJob::write()
{
    tidy();
    Result result = recorded(mRecord.record());
    if (result.bad())
        return result;
    if (!mDestination.tree().isEmpty())
        result = mDestination.writeHeld();
    if (result.bad()) {
        // A journal is a promise: whoever opens the destination next gives it what was to be written. So the database keeps
        // it too, or the file would show a correction of which nobody knows.
        return mDestination.file().hasJournal() ? leaveKept(result.text()) : failWriting(result.text());
    }
    if (mIsMove)
        result = writeSource();
    if (result.bad())
        return result;
    // Only now: until the files are written, a build must make the corrections from what was recorded.
    mRecord.finish(mDestination.tree(), mDestination.stamp(), mJob.studyUID);
    if (mIsMove)
        mRecord.finish(mSource.tree(), mSource.stamp(), mJob.oldStudyUID);
    return result;
}

Result QAJob::writeSource()
{
    const bool isEmpty = mSource.tree().isEmpty();
    Result written = isEmpty ? mSource.write() : mSource.writeHeld();
    if (written.good())
        return written;
    // Of a file that the system would not remove nobody knows whether it is gone.
    if (isEmpty || !takeBack())
        return leaveKept(written.text());
    return failWriting(written.text());
}

/// With the files as they were.
Result QAJob::failWriting(const QString& reason)
{
    const Result takenBack = mRecord.takeBack();
    if (takenBack.good())
        return Result::failure(reason);
    mJob.outcome.fault = ChangeFault::Kept;
    return Result::failure(reason + QStringLiteral("; ") + takenBack.text());
}

/// With files that are not what they were, or will not be. Only the database sees to both files of a move.
Result QAJob::leaveKept(const QString& reason)
{
    const bool isCompleted = !mIsMove || mRecord.isRecorded();
    const char* const left = !mIsMove ? kPromised : isCompleted ? kUntilBuilt : kInBothStudies;
    mJob.outcome.fault = isCompleted ? ChangeFault::Kept : ChangeFault::Failed;
    return Result::failure(reason + QStringLiteral("; ") + QLatin1String(left));
}

/// Makes the destination what it was, because the source could not be written. But what the source has a journal for
/// is a promise, and its images will leave it. False when the images stand in both studies then.
bool QAJob::takeBack()
{
    StudyFile& file = mDestination.file();
    if (mSource.file().hasJournal())
        return false;
    return (mBefore.isEmpty() ? file.remove() : file.write(mBefore, Tail::Cut)).good();
}

}  // namespace Kdd
