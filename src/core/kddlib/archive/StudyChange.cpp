#include "kddlib/archive/StudyChange.h"

#include "kddlib/archive/ArchiveDatabase.h"
#include "kddlib/archive/StudyCompletion.h"
#include "kddlib/tagfile/StudyRecord.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagfile/qa/QAData.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/base/Stopwatch.h"
#include "platform/os/FileStatus.h"
#include "platform/os/JournaledWrite.h"

#include <algorithm>

namespace Kdd
{

namespace
{

/// How many images of the node are listed.
int countListed(const ArchiveNode& node, const Kxg::StudyContents& contents)
{
    const auto isListed = [&](const Kxg::ListedImage& listed) {
        return (node.series.isEmpty() || listed.seriesInstanceUID == node.series) &&
               (node.image.isEmpty() || listed.key() == node.image);
    };
    return static_cast<int>(std::count_if(contents.images.begin(), contents.images.end(), isListed));
}

bool isHeld(const ArchiveNode& node, const TagFile& file)
{
    if (!node.image.isEmpty()) {
        const TagMap* image = file.findImage(node.image);
        return image != nullptr && (node.series.isEmpty() || image->uid(TagMap::SeriesLevel) == node.series);
    }
    return node.series.isEmpty() ? !file.isEmpty() : file.findSeries(node.series) != nullptr;
}

/// Takes what is selected out of the file held open.
void takeOut(const ArchiveNode& node, TagFile& file)
{
    const char* image = node.image.constData();
    const char* series = node.series.constData();
    if (!node.image.isEmpty())
        file.removeImages(1, &image);
    else if (!node.series.isEmpty())
        file.removeSeries(1, &series);
    else
        file.clear();
}

/// Says what there is not, by the innermost of the names that were given.
Removal absent(const ArchiveNode& node)
{
    const QString study = QString::fromUtf8(node.study);
    const bool isSeries = node.image.isEmpty();
    QString reason = QStringLiteral("There is no study %1").arg(study);
    if (!node.series.isEmpty() || !node.image.isEmpty())
        reason = QStringLiteral("Study %1 has no %2 %3")
                     .arg(study, isSeries ? QStringLiteral("series") : QStringLiteral("image"),
                          QString::fromUtf8(isSeries ? node.series : node.image));
    return {ChangeFault::Absent, Result::failure(reason), 0};
}

Removal unasked(const Result& result)
{
    return {ChangeFault::Unasked, result, 0};
}

Result unchanged(const QByteArray& studyUID, const TagFile& file)
{
    const QString what = QStringLiteral("Study %1 is not changed").arg(QString::fromUtf8(studyUID));
    return file.failure().isEmpty() ? Result::failure(what) : Result::failure(file.failure()).within(what);
}

/// From a tag file that the catalogue does not know.
Removal removeUnregistered(const ArchiveNode& node)
{
    TagFile file;
    const QString path = TagFile::cacheFilePathForStudy(node.study.constData());
    if (presenceOf(path) == FilePresence::Absent)
        return absent(node);
    if (!file.readWhenFreeForStudy(node.study.constData(), true)) {
        const auto fault = file.wasLockedOut() ? ChangeFault::LockedOut : ChangeFault::Failed;
        return {fault, unchanged(node.study, file), 0};
    }
    if (!isHeld(node, file))
        return absent(node);
    const int before = file.imagesByUID().size();
    takeOut(node, file);
    const int left = file.imagesByUID().size();
    if (file.writeCacheFile())
        return {ChangeFault::None, {}, before - left};
    if (!hasJournal(path))
        return {ChangeFault::Failed, unchanged(node.study, file), 0};
    const QString reason = file.failure() + QStringLiteral("; whoever opens the tag file next completes it");
    return {ChangeFault::Kept, Result::failure(reason), before - left};
}

/// Each attempt waits some 0.4 seconds for others.
Result tryFor(int patienceMs, bool (*attempt)(QAData&, QString&), QAData& job)
{
    const Stopwatch waiting;
    QString reason;
    bool isDone = attempt(job, reason);
    while (!isDone && job.outcome.fault == ChangeFault::LockedOut && waiting.elapsed() < patienceMs)
        isDone = attempt(job, reason);
    return isDone ? Result() : Result::failure(reason);
}

}  // namespace

Removal StudyChange::remove(const ArchiveNode& node, int patienceMs)
{
    bool isRegistered = false;
    const Result found = mCatalogue.findStudy(node.study, isRegistered);
    if (found.bad())
        return unasked(found);
    return isRegistered ? removeRegistered(node, patienceMs) : removeUnregistered(node);
}

Removal StudyChange::removeRegistered(const ArchiveNode& node, int patienceMs)
{
    std::unique_ptr<Kxg::StudyClaim> claim;
    Kxg::StudyContents contents;
    Result result = mCatalogue.claim(node.study, patienceMs, claim);
    if (result.good() && claim == nullptr)
        return {ChangeFault::LockedOut,
                Result::failure(QStringLiteral("Study %1 is being worked on by another process")
                                    .arg(QString::fromUtf8(node.study))),
                0};
    bool isRegistered = true;
    // Others may have removed it while this waited for them.
    if (result.bad() && mCatalogue.findStudy(node.study, isRegistered).good() && !isRegistered)
        return removeUnregistered(node);
    if (result.good())
        result = mCatalogue.studyContents(node.study, contents);
    if (result.bad())
        return unasked(result);
    // What a removal that died has left in the tag file goes with its repeat.
    TagFile present;
    const bool isWholeStudy = node.series.isEmpty() && node.image.isEmpty();
    const int images = countListed(node, contents);
    if (!isWholeStudy && images == 0 &&
        !(present.readWhenFreeForStudy(node.study.constData(), false) && isHeld(node, present)))
        return absent(node);
    // The database first: whatever dies from here on leaves a study that waits to be completed.
    result = forget(node);
    if (result.bad())
        return unasked(result);
    StudyCompletion completion(mCatalogue);
    // What had changed before this removal is not in the tag file yet,
    // so taking images out of that would not do.
    result = (contents.changes.isEmpty() ? completion.reduce(*claim) : completion.build(*claim)).result;
    return {result.good() ? ChangeFault::None : ChangeFault::Kept, result, images};
}

Result StudyChange::forget(const ArchiveNode& node)
{
    if (!node.image.isEmpty())
        return mCatalogue.removeImage(node.study, node.image);
    if (!node.series.isEmpty())
        return mCatalogue.removeSeries(node.study, node.series);
    return mCatalogue.removeStudy(node.study);
}

Result StudyChange::correct(QAData& job, int patienceMs)
{
    return tryFor(patienceMs, TagFile::applyQA, job);
}

Result StudyChange::preview(QAData& job, int patienceMs)
{
    return tryFor(patienceMs, TagFile::previewQA, job);
}

Result StudyChange::synchronise(const QByteArray& studyUID, TagFile& file)
{
    std::unique_ptr<Kxg::StudyClaim> claim;
    Kxg::StudyContents contents;
    Result result = claimStudy(mCatalogue, studyUID, claim);
    if (result.good())
        result = mCatalogue.studyContents(studyUID, contents);
    if (result.bad())
        return result;
    // Before the file is written further down, which makes it another one.
    const bool isStale = !isTagFile(TagFile::cacheFilePathForStudy(studyUID.constData()), contents.tagFile);
    if (!file.readAndSync(studyUID.constData(), nullptr))
        return unchanged(studyUID, file);
    // What it shows may be older than what is registered, and would be taken for the newest once it is written.
    if (isStale)
        result = mCatalogue.requestBuild({studyUID});
    if (result.bad())
        return result;
    file.optimizeAll();
    qint64 request = 0;
    result = mCatalogue.requestRewrite(studyUID, request);
    if (result.bad() || !file.writeCacheFile())
        return result.bad() ? result : unchanged(studyUID, file);
    if (isStale)
        LogFile::warnf("The tag file of study %s was not the one written last; the study waits to be built",
                       studyUID.constData());
    // Files that wait to be built in are not opened here.
    return claim->finishChange(builtStudy(file), request);
}

}  // namespace Kdd
