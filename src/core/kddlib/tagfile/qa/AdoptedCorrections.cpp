#include "kddlib/tagfile/qa/AdoptedCorrections.h"

#include "kddlib/Limits.h"
#include "kddlib/net/dicom/RemoteDicom.h"
#include "kddlib/tagfile/StudyTree.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/database/Kxg.h"

#include <dcmtk/dcmdata/dcfilefo.h>

#include <algorithm>
#include <utility>

namespace Kdd
{

AdoptedCorrections::AdoptedCorrections(const QMap<QByteArray, TagMap*>& former, const BuildCorrections& known,
                                       QSet<QByteArray> listed)
    : mFormer(former)
    , mKnown(known)
    , mListed(std::move(listed))
{
}

AdoptedCorrections::~AdoptedCorrections() = default;

Result AdoptedCorrections::record()
{
    for (const TagMap* image : mFormer) {
        if (mResult.good())
            look(*image);
    }
    // Of corrections that could not all be looked at none is recorded: a part would pass for the whole.
    if (mResult.bad() || mFound.empty())
        return mResult;
    QMap<QByteArray, qint64> requests;
    mResult = openCatalogue();
    if (mResult.good())
        mResult = mCatalogue->recordCorrections(mFound, requests);
    mRequest = requests.value(mKnown.studyUID(), 0);
    return mResult;
}

Result AdoptedCorrections::finish()
{
    return mRequest != 0 ? mCatalogue->finishRequests({mRequest}) : Result();
}

/// Looks an image that has a log up in the database, by what it shows and then by what it was. Where the
/// database tells the same or more there is nothing to do; where the log goes on from there, or the database
/// knows nothing, the rest is recorded; where the two part, the database counts.
void AdoptedCorrections::look(const TagMap& image)
{
    AuditLog log;
    QVector<AuditEntry> entries;
    if (!log.read(image) || !log.decode(entries))
        return leaveUndecided(image, "its audit log is damaged");
    if (entries.isEmpty())
        return;
    const QByteArray key = StudyTree::imageKey(image);
    ImageIdentity identity = {mKnown.studyUID(), key};
    std::vector<Kxg::ImageCorrection> elsewhere;
    const Kxg::ImageCorrection* known = mKnown.findShown(key, log);
    if (known == nullptr && !identify(image, log, identity))
        return;
    if (known == nullptr)
        known = find(identity, elsewhere);
    if (mResult.bad() || (known == nullptr && !isToBeKept(image, log, identity)))
        return;
    ImageOverlay overlay;
    if (known != nullptr) {
        const AuditLog recorded = logOf(*known);
        if (isSameOrContinued(log, recorded))
            return;
        if (!isSameOrContinued(recorded, log)) {
            LogFile::warnf(
                "Image %s of study %s was corrected otherwise than the image database knows, which "
                "counts",
                key.constData(), mKnown.studyUID().constData());
            return;
        }
        identity = {known->studyInstanceUID, known->image};
        overlay.decode(known->changes);
    }
    overlay.noteLogged(image);
    mFound.push_back({identity.studyUID, identity.image, mKnown.studyUID(), overlay.seriesOf(image), key,
                      overlay.encode()});
}

/// Which image a corrected one was. False when its log came with the file.
bool AdoptedCorrections::identify(const TagMap& image, const AuditLog& log, ImageIdentity& identity)
{
    const QByteArray path = filePathOf(image);
    DcmFileFormat file;
    identity = identityBefore(log, identity, path);
    // Without the file the log has to tell what the image was.
    if (loadDicomHeader(path, file).bad())
        return true;
    const std::unique_ptr<TagMap> loaded(TagMap::createTagMap(file.getDataset(), kDefaultValueBound));
    AuditLog own;
    if (own.read(*loaded) && isSameOrContinued(log, own))
        return false;
    identity = identityOf(*loaded, path);
    return true;
}

/// Null when the image was never corrected as far as the database knows. `elsewhere` holds what is found of an image
/// that came from another study.
const Kxg::ImageCorrection* AdoptedCorrections::find(const ImageIdentity& identity,
                                                     std::vector<Kxg::ImageCorrection>& elsewhere)
{
    if (identity.studyUID == mKnown.studyUID())
        return mKnown.find(identity);
    mResult = openCatalogue();
    if (mResult.good())
        mResult = mCatalogue->corrections(identity.studyUID, elsewhere);
    const auto found =
        std::find_if(elsewhere.begin(), elsewhere.end(), [&](const Kxg::ImageCorrection& each) {
            return ImageIdentity{each.studyInstanceUID, each.image} == identity;
        });
    return found != elsewhere.end() ? &*found : nullptr;
}

/// False for an image that was removed from the database since it was corrected.
bool AdoptedCorrections::isToBeKept(const TagMap& image, const AuditLog& log, const ImageIdentity& identity)
{
    const QByteArray path = filePathOf(image);
    if (identity.studyUID == mKnown.studyUID())
        return mListed.contains(path) || isListed(identity, path);
    // A file that was replaced by one of another study is no image that was moved here.
    const ImageIdentity before = identityBefore(log, {mKnown.studyUID(), StudyTree::imageKey(image)}, path);
    if (before.studyUID != identity.studyUID)
        return false;
    if (isListed(identity, path))
        return true;
    if (mResult.good()) {
        // The file is not listed here, so that its path is only known from the image.
        leaveUndecided(image, "it does not list the image in the study that it was moved from");
        mUndecided.insert(path);
    }
    return false;
}

bool AdoptedCorrections::isListed(const ImageIdentity& identity, const QByteArray& path)
{
    Kxg::StudyContents contents;
    mResult = openCatalogue();
    if (mResult.good())
        mResult = mCatalogue->studyContents(identity.studyUID, contents);
    return std::any_of(contents.images.begin(), contents.images.end(), [&](const Kxg::ListedImage& listed) {
        // By path or by UID: the study may list another file of the image.
        return listed.path == path ||
               (!listed.sopInstanceUID.isEmpty() && listed.sopInstanceUID == identity.image);
    });
}

void AdoptedCorrections::leaveUndecided(const TagMap& image, const char* reason)
{
    const QByteArray path = filePathOf(image);
    LogFile::warnf("The corrections of image %s of study %s cannot be kept in the image database: %s",
                   StudyTree::imageKey(image).constData(), mKnown.studyUID().constData(), reason);
    if (mListed.contains(path))
        mUndecided.insert(path);
}

Result AdoptedCorrections::openCatalogue()
{
    // Not before it is needed: nearly all tag files tell of no correction that is not known.
    Result result;
    if (mCatalogue == nullptr)
        mCatalogue = Kxg::Catalogue::open(Kxg::DatabaseServer(), result);
    return result;
}

}  // namespace Kdd
