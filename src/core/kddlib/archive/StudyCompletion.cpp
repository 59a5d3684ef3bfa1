#include "kddlib/archive/StudyCompletion.h"

#include "kddlib/Limits.h"
#include "kddlib/TagFileGenerator.h"
#include "kddlib/archive/ObjectInput.h"
#include "kddlib/net/http/ObjectAddress.h"
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

/// Whether the tree has the image from the file that counts.
bool holds(const TagFile& file, const Kxg::ListedImage& listed)
{
    const TagMap* image = file.findImage(listed.key());
    return image != nullptr && filePathOf(*image) == listed.path;
}

/// Takes out of the arrivals what the present tag file has from the same files.
void leaveOutHeld(TagFile& arrivals, const TagFile& present)
{
    std::vector<QByteArray> held;
    const auto& images = arrivals.imagesByUID();
    for (auto it = images.cbegin(); it != images.cend(); ++it) {
        const TagMap* image = present.findImage(it.key());
        if (image != nullptr && filePathOf(*image) == filePathOf(*it.value()))
            held.push_back(it.key());
    }
    std::vector<const char*> keys;
    keys.reserve(held.size());
    for (const QByteArray& key : held)
        keys.push_back(key.constData());
    arrivals.removeImages(static_cast<int>(keys.size()), keys.data());
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
    const QByteArray& studyUID = claim.studyInstanceUID();
    // Others have done what was asked for here.
    if (!isChanged() && !requests.isEmpty() &&
        isTagFile(TagFile::cacheFilePathForStudy(studyUID.constData()), mContents.tagFile) &&
        present.readWhenFreeForStudy(studyUID.constData(), false))
        return {{}, false, present.statistics()};
    if (canMerge(studyUID, arrivals, requests, present))
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
        TagFile nothing;
        return build(claim, nothing);
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
    qint64 request = 0;
    Result known = read(claim);
    // It may be built although nothing changed.
    if (known.good() && !mContents.isWaiting && !mContents.images.empty())
        known = mCatalogue.requestRewrite(claim.studyInstanceUID(), request);
    // What came meanwhile is built in, for the claim takes it for done.
    if (known.good() && request != 0)
        known = read(claim);
    if (known.bad())
        return {known, false, {}};
    TagFile nothing;
    return mContents.images.empty() ? remove(claim) : build(claim, nothing);
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
CompletedStudy StudyCompletion::build(Kxg::StudyClaim& claim, TagFile& loaded) const
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

/// With the arrivals that others have taken, of which only the catalogue tells, in `arrivals` too.
bool StudyCompletion::canMerge(const QByteArray& studyUID, TagFile& arrivals, const QVector<qint64>& requests,
                               TagFile& present) const
{
    QVector<qint64> additions;
    if (mContents.changes.isEmpty() || mCatalogue.additions(studyUID, additions).bad())
        return false;
    // A file of the same path and image may have been registered with other content.
    const bool isAlone = std::all_of(mContents.changes.begin(), mContents.changes.end(), [&](qint64 request) {
        return requests.contains(request) || additions.contains(request);
    });
    // What costs least is asked first: whether the tag file is the one written last, and what it holds, only
    // when nothing else speaks against merging.
    if (!isAlone || (!arrivals.isEmpty() && arrivals.studyInstanceUID() != studyUID) ||
        !isTrusted(studyUID) || !present.readWhenFreeForStudy(studyUID.constData(), false))
        return false;
    // Others may have merged them, which they cannot with other content than the one that is here.
    if (std::all_of(requests.begin(), requests.end(), [&](qint64 each) {
            return !mContents.changes.contains(each) || additions.contains(each);
        }))
        leaveOutHeld(arrivals, present);
    return bringListed(studyUID, arrivals, present) && !arrivals.isEmpty() &&
           holdsListed(arrivals, present) &&
           std::all_of(arrivals.imagesByUID().keyBegin(), arrivals.imagesByUID().keyEnd(),
                       [&](const QByteArray& key) { return mListed.contains(key); }) &&
           unlisted(present).empty();
}

/// Reads the images that are listed and that neither of them holds: others took them in. False when there are so many
/// that a build costs no more, or one cannot be read as the image that was registered.
bool StudyCompletion::bringListed(const QByteArray& studyUID, TagFile& arrivals, const TagFile& present) const
{
    std::vector<const Kxg::ListedImage*> absent;
    for (const Kxg::ListedImage& listed : mContents.images) {
        if (!holds(arrivals, listed) && !holds(present, listed))
            absent.push_back(&listed);
    }
    if (2 * absent.size() > mContents.images.size())
        return false;
    QList<QByteArray> urls;
    for (const Kxg::ListedImage* listed : absent) {
        if (isObjectAddress(listed->path))
            urls.append(listed->path);
    }
    PlainObjects objects(urls, {}, kDefaultValueBound);
    for (const Kxg::ListedImage* listed : absent) {
        DicomInput input = isObjectAddress(listed->path) ? takeObject(listed->path, objects.next())
                                                         : readDicomInput(listed->path, Damage::Refused);
        if (input.kind != DicomInput::Kind::Image || input.studyUID != studyUID ||
            input.seriesUID != listed->seriesInstanceUID ||
            input.map->uid(TagMap::ImageLevel) != listed->sopInstanceUID ||
            TagFileGenerator::place(arrivals, std::move(input.map), listed->path) == nullptr)
            return false;
    }
    return true;
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
