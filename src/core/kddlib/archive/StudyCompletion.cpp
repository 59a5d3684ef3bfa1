#include "kddlib/archive/StudyCompletion.h"

#include "kddlib/TagFileGenerator.h"
#include "kddlib/archive/ArchiveDatabase.h"
#include "kddlib/tagfile/StudyRecord.h"
#include "kddlib/tagfile/TagFileRemoval.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/resources/ExResource.h"

#include <QDateTime>
#include <QThread>

#include <algorithm>
#include <iterator>

namespace Kdd
{

namespace
{

/// For about two minutes while others hold the file: each attempt to merge waits two seconds, one to remove not at all.
constexpr int kMergeAttempts = 60;
constexpr int kRemovalAttempts = 6000;
constexpr unsigned long kPause = 20;  // [ms]

bool removeStudyFile(const QByteArray& studyUID)
{
    const QString path = TagFile::cacheFilePathForStudy(studyUID.constData());
    for (int i = 0; i < kRemovalAttempts; ++i) {
        if (removeTagFileOnce(path).good())
            return true;
        QThread::msleep(kPause);
    }
    LogFile::errorf("The tag file of study %s cannot be removed: others hold it", studyUID.constData());
    return false;
}

/// A study whose tag file shows the order in which it came about.
Kxg::BuiltStudy unsettled(const TagFile& file)
{
    Kxg::BuiltStudy built = builtStudy(file);
    built.settleAt = QDateTime::currentMSecsSinceEpoch() + 1000LL * ExResource::settleSeconds();
    return built;
}

}  // namespace

CompletedStudy StudyCompletion::complete(Kxg::StudyClaim& claim, TagFile& arrivals,
                                         const QVector<qint64>& requests)
{
    if (!readContents(claim))
        return {};
    if (mContents.images.empty())
        return remove(claim);
    TagFile present;
    if (canMerge(claim.studyInstanceUID(), arrivals, requests, present))
        return merge(claim, arrivals, present);
    return build(claim, arrivals);
}

CompletedStudy StudyCompletion::reduce(Kxg::StudyClaim& claim)
{
    if (!readContents(claim))
        return {};
    if (mContents.images.empty())
        return remove(claim);
    TagFile present;
    const QByteArray& studyUID = claim.studyInstanceUID();
    // The removal itself has left one request.
    if (mContents.changes.size() > 1 || !isTrusted(studyUID) ||
        !present.readWhenFreeForStudy(studyUID.constData(), true) || !holdsListed(TagFile(), present)) {
        present.close();
        return build(claim, TagFile());
    }
    const std::vector<QByteArray> gone = unlisted(present);
    std::vector<const char*> keys;
    for (const QByteArray& key : gone)
        keys.push_back(key.constData());
    present.removeImages(static_cast<int>(keys.size()), keys.data());
    present.createAbstractTags();
    present.optimizeAll();
    if (!present.writeCacheFile()) {
        LogFile::errorf("Study %s is not changed: %s", studyUID.constData(),
                        qUtf8Printable(present.failure()));
        return {};
    }
    return {succeeded(claim.finish(unsettled(present))), false, present.statistics()};
}

CompletedStudy StudyCompletion::build(Kxg::StudyClaim& claim)
{
    if (!readContents(claim))
        return {};
    return mContents.images.empty() ? remove(claim) : build(claim, TagFile());
}

/// What was requested up to now is seen by what is read after it.
bool StudyCompletion::readContents(Kxg::StudyClaim& claim)
{
    if (!succeeded(claim.noteRequests()) ||
        !succeeded(mCatalogue.studyContents(claim.studyInstanceUID(), mContents)))
        return false;
    mListed.clear();
    for (const Kxg::ListedImage& image : mContents.images)
        mListed.insert(image.key());
    return true;
}

CompletedStudy StudyCompletion::remove(Kxg::StudyClaim& claim)
{
    const bool isRemoved = removeStudyFile(claim.studyInstanceUID()) && succeeded(claim.finishRemoved());
    return {isRemoved, isRemoved, {}};
}

CompletedStudy StudyCompletion::build(Kxg::StudyClaim& claim, const TagFile& loaded) const
{
    TagFile whole;
    const QByteArray& studyUID = claim.studyInstanceUID();
    TagFileGenerator generator(nullptr, mOptimize);
    if (!generator.createTagFile(whole, claim.studyId(), studyUID.constData(), loaded)) {
        LogFile::errorf("The tag file of study %s is not built: %s", studyUID.constData(),
                        whole.isEmpty() ? "none of its files could be read"
                                        : qUtf8Printable(whole.failure()));
        return {};
    }
    // What could not be read stays as it was, and the next build tries again.
    Kxg::BuiltStudy built = builtStudy(whole);
    built.isComplete = generator.numKept() == 0 && generator.numMissing() == 0;
    if (!built.isComplete)
        LogFile::errorf("Study %s is built, but goes on waiting: %d files could not be read",
                        studyUID.constData(), generator.numKept() + generator.numMissing());
    return {succeeded(claim.finish(built)) && built.isComplete, false, whole.statistics()};
}

/// Volumes are made of images that may be anywhere in the study, and a correction may lead an arrival elsewhere: such
/// studies are built as a whole.
bool StudyCompletion::isTrusted(const QByteArray& studyUID) const
{
    return mOptimize && mContents.volumes.isEmpty() && !mContents.isCorrected &&
           isTagFile(TagFile::cacheFilePathForStudy(studyUID.constData()), mContents.tagFile);
}

bool StudyCompletion::canMerge(const QByteArray& studyUID, const TagFile& arrivals,
                               const QVector<qint64>& requests, TagFile& present) const
{
    // A file of the same path and image may have been registered with other content.
    const bool isAlone = std::all_of(mContents.changes.begin(), mContents.changes.end(),
                                     [&](qint64 request) { return requests.contains(request); });
    return isAlone && arrivals.studyInstanceUID() == studyUID && isTrusted(studyUID) &&
           present.readWhenFreeForStudy(studyUID.constData(), false) && holdsListed(arrivals, present) &&
           std::all_of(arrivals.imagesByUID().keyBegin(), arrivals.imagesByUID().keyEnd(),
                       [&](const QByteArray& key) { return mListed.contains(key); }) &&
           unlisted(present).empty();
}

/// Whether the tag file with the arrivals in it holds every image that is listed, from the file that counts.
bool StudyCompletion::holdsListed(const TagFile& arrivals, const TagFile& present) const
{
    return std::all_of(mContents.images.begin(), mContents.images.end(), [&](const Kxg::ListedImage& listed) {
        const QByteArray& key = listed.key();
        const TagMap* image = arrivals.findImage(key);
        if (image == nullptr)
            image = present.findImage(key);
        return image != nullptr && filePathOf(*image) == listed.path;
    });
}

/// The images of the tag file that the catalogue does not list.
std::vector<QByteArray> StudyCompletion::unlisted(const TagFile& present) const
{
    std::vector<QByteArray> keys;
    const auto& held = present.imagesByUID();
    std::copy_if(held.keyBegin(), held.keyEnd(), std::back_inserter(keys),
                 [this](const QByteArray& key) { return !mListed.contains(key); });
    return keys;
}

CompletedStudy StudyCompletion::merge(Kxg::StudyClaim& claim, TagFile& arrivals, TagFile& present)
{
    TagFileGenerator().completeArrivals(arrivals, present);
    bool isMerged = arrivals.mergeIntoCacheFile();
    for (int i = 1; i < kMergeAttempts && !isMerged && arrivals.wasLockedOut(); ++i)
        isMerged = arrivals.mergeIntoCacheFile();
    if (!isMerged) {
        LogFile::errorf("The tag file of study %s is not completed: %s", claim.studyInstanceUID().constData(),
                        qUtf8Printable(arrivals.failure()));
        return {};
    }
    return {succeeded(claim.finish(unsettled(arrivals))), false, arrivals.statistics()};
}

}  // namespace Kdd
