#include "kddlib/archive/StudyCompletion.h"

#include "kddlib/TagFileGenerator.h"
#include "kddlib/tagfile/StudyRecord.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/resources/ExResource.h"

#include <QDateTime>

#include <algorithm>
#include <iterator>

namespace Kdd
{

namespace
{

/// Each waits two seconds, so it goes on for two minutes while others hold the file.
constexpr int kMergeAttempts = 60;

/// "The tag file of study ... is not built", or whatever else was not done, with the reason.
CompletedStudy failed(const char* format, const QByteArray& studyUID, const QString& reason)
{
    const QString what = QString::fromLatin1(format).arg(QString::fromUtf8(studyUID));
    CompletedStudy completed;
    completed.result = Result::failure(reason).within(what);
    return completed;
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
    const Result known = read(claim);
    return known.good() ? completeRead(claim, arrivals, requests) : CompletedStudy{known, false, {}};
}

CompletedStudy StudyCompletion::completeRead(Kxg::StudyClaim& claim, TagFile& arrivals,
                                             const QVector<qint64>& requests)
{
    if (mContents.images.empty())
        return remove(claim);
    TagFile present;
    if (canMerge(claim.studyInstanceUID(), arrivals, requests, present))
        return merge(claim, arrivals, present);
    return build(claim, arrivals);
}

CompletedStudy StudyCompletion::reduce(Kxg::StudyClaim& claim)
{
    Result known = read(claim);
    if (known.bad())
        return {known, false, {}};
    if (mContents.images.empty())
        return remove(claim);
    TagFile present;
    const QByteArray& studyUID = claim.studyInstanceUID();
    // The removal itself has left one request.
    if (mContents.changes.size() > 1 || !isTrusted(studyUID) ||
        !present.readWhenFreeForStudy(studyUID.constData(), true) || !holdsListed(TagFile(), present)) {
        // Held alone so far; the build takes the lock itself.
        present.close();
        return build(claim, TagFile());
    }
    // Whatever is not listed goes, so that a removal that died half way is completed as well.
    const std::vector<QByteArray> gone = unlisted(present);
    std::vector<const char*> keys;
    keys.reserve(gone.size());
    for (const QByteArray& key : gone)
        keys.push_back(key.constData());
    present.removeImages(static_cast<int>(keys.size()), keys.data());
    present.createAbstractTags();
    present.optimizeAll();
    if (!present.writeCacheFile())
        return failed("Study %1 is not changed", studyUID, present.failure());
    return {claim.finish(unsettled(present)), false, present.statistics()};
}

CompletedStudy StudyCompletion::build(Kxg::StudyClaim& claim)
{
    Result known = read(claim);
    if (known.bad())
        return {known, false, {}};
    return mContents.images.empty() ? remove(claim) : build(claim, TagFile());
}

/// What was requested up to now is seen by what is read after it.
Result StudyCompletion::read(Kxg::StudyClaim& claim)
{
    Result result = claim.noteRequests();
    if (result.good())
        result = mCatalogue.studyContents(claim.studyInstanceUID(), mContents);
    mListed.clear();
    for (const Kxg::ListedImage& image : mContents.images)
        mListed.insert(image.key());
    return result;
}

/// The file goes first: whatever dies in between leaves a study that waits.
CompletedStudy StudyCompletion::remove(Kxg::StudyClaim& claim)
{
    Result result = TagFileGenerator::removeTagFile(claim.studyInstanceUID());
    if (result.good())
        result = claim.finishRemoved();
    return {result, result.good(), {}};
}

/// What is loaded already spares the build the reading of those files.
CompletedStudy StudyCompletion::build(Kxg::StudyClaim& claim, const TagFile& loaded) const
{
    TagFile whole;
    const QByteArray& studyUID = claim.studyInstanceUID();
    const bool isTrustedStamp =
        isTagFile(TagFile::cacheFilePathForStudy(studyUID.constData()), mContents.tagFile);
    TagFileGenerator generator(nullptr, mOptimize);
    if (!generator.createTagFile(whole, claim.studyId(), studyUID.constData(), loaded))
        return failed("The tag file of study %1 is not built", studyUID,
                      whole.isEmpty() ? QStringLiteral("none of its files could be read") : whole.failure());
    // What could not be read stays as it was, and the next build tries again.
    Kxg::BuiltStudy built = builtStudy(whole);
    const int numUnread = generator.numKept() + generator.numMissing();
    built.isComplete = numUnread == 0;
    // Nothing has changed but the order of what arrived.
    built.isOnlyRearranged = mContents.changes.isEmpty() && isTrustedStamp;
    Result result = claim.finish(built);
    if (result.good() && numUnread > 0)
        return failed("Study %1 is built, but goes on waiting", studyUID,
                      QStringLiteral("%1 files could not be read").arg(numUnread));
    return {result, false, whole.statistics()};
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
    // What costs least is asked first: whether the tag file is the one written last, and what it holds, only
    // when nothing else speaks against merging.
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

/// Tried again only while others hold the file; any other fault would be the same the next time.
CompletedStudy StudyCompletion::merge(Kxg::StudyClaim& claim, TagFile& arrivals, TagFile& present)
{
    // Previews are chosen among all images of the study, so what is there goes along.
    TagFileGenerator().completeArrivals(arrivals, present);
    bool isMerged = arrivals.mergeIntoCacheFile();
    for (int i = 1; i < kMergeAttempts && !isMerged && arrivals.wasLockedOut(); ++i)
        isMerged = arrivals.mergeIntoCacheFile();
    if (!isMerged)
        return failed("The tag file of study %1 is not completed", claim.studyInstanceUID(),
                      arrivals.failure());
    return {claim.finish(unsettled(arrivals)), false, arrivals.statistics()};
}

}  // namespace Kdd
