#include "kddlib/archive/StudyChange.h"

#include "kddlib/archive/ArchiveDatabase.h"
#include "kddlib/archive/StudyCompletion.h"
#include "kddlib/tagfile/StudyRecord.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagfile/qa/QAData.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/os/FileStatus.h"
#include "platform/os/PathName.h"

#include <algorithm>

namespace Kdd
{

namespace
{

/// Each waits 0.4 seconds, so it goes on for two minutes.
constexpr int kAttempts = 300;

bool isListed(const ArchiveNode& node, const Kxg::StudyContents& contents)
{
    return std::any_of(contents.images.begin(), contents.images.end(), [&](const Kxg::ListedImage& listed) {
        return (node.series.isEmpty() || listed.seriesInstanceUID == node.series) &&
               (node.image.isEmpty() || listed.key() == node.image);
    });
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

bool failAbsent(const ArchiveNode& node)
{
    if (node.series.isEmpty() && node.image.isEmpty())
        LogFile::errorf("There is no study %s", node.study.constData());
    else
        LogFile::errorf("Study %s has no %s %s", node.study.constData(),
                        node.image.isEmpty() ? "series" : "image",
                        (node.image.isEmpty() ? node.series : node.image).constData());
    return false;
}

bool failChanging(const QByteArray& studyUID, const TagFile& file)
{
    LogFile::errorf("Study %s is not changed: %s", studyUID.constData(), qUtf8Printable(file.failure()));
    return false;
}

/// From a tag file that the catalogue does not know.
bool removeUnregistered(const ArchiveNode& node)
{
    TagFile file;
    FileStatus status;
    const QString path = TagFile::cacheFilePathForStudy(node.study.constData());
    if (!statusOf(pathBytes(path).constData(), status))
        return failAbsent(node);
    if (!file.readWhenFreeForStudy(node.study.constData(), true))
        return failChanging(node.study, file);
    if (!isHeld(node, file))
        return failAbsent(node);
    takeOut(node, file);
    return file.writeCacheFile() || failChanging(node.study, file);
}

}  // namespace

bool StudyChange::remove(const ArchiveNode& node)
{
    QVector<QByteArray> registered;
    if (!succeeded(mCatalogue.findStudies(node.study, 1, registered)))
        return false;
    return registered.contains(node.study) ? removeRegistered(node) : removeUnregistered(node);
}

bool StudyChange::removeRegistered(const ArchiveNode& node)
{
    const std::unique_ptr<Kxg::StudyClaim> claim = claimStudy(mCatalogue, node.study);
    Kxg::StudyContents contents;
    if (claim == nullptr || !succeeded(mCatalogue.studyContents(node.study, contents)))
        return false;
    // What a removal that died has left in the tag file goes with its repeat.
    TagFile present;
    const bool isWholeStudy = node.series.isEmpty() && node.image.isEmpty();
    if (!isWholeStudy && !isListed(node, contents) &&
        !(present.readWhenFreeForStudy(node.study.constData(), false) && isHeld(node, present)))
        return failAbsent(node);
    if (!forget(node))
        return false;
    StudyCompletion completion(mCatalogue);
    return (contents.changes.isEmpty() ? completion.reduce(*claim) : completion.build(*claim)).isDone;
}

bool StudyChange::forget(const ArchiveNode& node)
{
    if (!node.image.isEmpty())
        return succeeded(mCatalogue.removeImage(node.study, node.image));
    if (!node.series.isEmpty())
        return succeeded(mCatalogue.removeSeries(node.study, node.series));
    return succeeded(mCatalogue.removeStudy(node.study));
}

bool StudyChange::correct(QAData& job, QString& message)
{
    bool isDone = TagFile::applyQA(job, message);
    for (int i = 1; i < kAttempts && !isDone && job.outcome.isLockedOut; ++i)
        isDone = TagFile::applyQA(job, message);
    return isDone;
}

bool StudyChange::synchronise(const QByteArray& studyUID, TagFile& file)
{
    const std::unique_ptr<Kxg::StudyClaim> claim = claimStudy(mCatalogue, studyUID);
    Kxg::StudyContents contents;
    if (claim == nullptr || !succeeded(mCatalogue.studyContents(studyUID, contents)))
        return false;
    const bool isStale = !isTagFile(TagFile::cacheFilePathForStudy(studyUID.constData()), contents.tagFile);
    if (!file.readAndSync(studyUID.constData(), nullptr))
        return false;
    // What it shows may be older than what is registered, and would be taken for the newest once it is written.
    if (isStale && !succeeded(mCatalogue.requestBuild({studyUID})))
        return false;
    file.optimizeAll();
    if (!file.writeCacheFile())
        return failChanging(studyUID, file);
    Kxg::BuiltStudy built = builtStudy(file);
    // Files that wait to be built in are not opened here.
    built.isComplete = false;
    if (isStale)
        LogFile::warnf("The tag file of study %s was not the one written last; the study waits to be built",
                       studyUID.constData());
    return succeeded(claim->finish(built));
}

}  // namespace Kdd
