#include "kddlib/StudySources.h"

#include "kddlib/net/dicom/LocalFiles.h"
#include "kddlib/net/http/ObjectAddress.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/database/DirectoryEntry.h"
#include "platform/database/Kxg.h"
#include "platform/os/FileStatus.h"

#include <algorithm>

namespace Kdd
{

namespace
{

constexpr std::size_t kMaxDatasets = 500;

/// Each waits 0.4 seconds for whoever holds the present tag file.
constexpr int kReadingAttempts = 5;

}  // namespace

void KeptDatasets::keep(const QByteArray& path, std::unique_ptr<DcmDataset> dataset)
{
    if (mDatasets.size() < kMaxDatasets)
        mDatasets.emplace(path, std::move(dataset));
}

DcmDataset* KeptDatasets::find(const QByteArray& path) const
{
    const auto it = mDatasets.find(path);
    return it != mDatasets.end() ? it->second.get() : nullptr;
}

ImagesByPath::ImagesByPath(const TagFile& file)
{
    for (const TagMap* image : file.imagesByUID())
        mImages.insert(filePathOf(*image), image);
}

std::unique_ptr<TagMap> ImagesByPath::copy(const std::string& path) const
{
    const TagMap* image = mImages.value(QByteArray::fromStdString(path), nullptr);
    // The preview stays: an image that comes from the former tag file may have no file to make one from.
    std::unique_ptr<TagMap> copy(image != nullptr ? image->clone() : nullptr);
    for (const DcmTagKey& key :
         {kFilePath, kFileSuffix, kVolumeIndex, kFromDatabase, kHasVolumeFile, kAbstract}) {
        if (copy != nullptr)
            copy->deleteElement(key);
    }
    return copy;
}

std::unique_ptr<TagMap> ImagesAhead::take(const QByteArray& path, ObjectRead& object)
{
    if (!mUrls.isEmpty() && mUrls.first() == path) {
        mUrls.removeFirst();
        object = mObjects.next();
        return object.isPlain ? std::move(object.image.map) : nullptr;
    }
    if (mPaths.isEmpty() || mPaths.first() != path)
        return nullptr;
    mPaths.removeFirst();
    PlainRead read = mFiles.next();
    return read.isPlain ? std::move(read.image.map) : nullptr;
}

ImagesAhead StudySources::readAhead(int threads) const
{
    QList<QByteArray> paths;
    QList<QByteArray> urls;
    for (const std::string& path : dicomFiles) {
        const QByteArray name = QByteArray::fromStdString(path);
        if (adopted->undecided().contains(name) || loaded.contains(name))
            continue;
        if (isObjectAddress(name))
            urls.append(name);
        else if (isReadLocally(path.c_str()))
            paths.append(name);
    }
    return {paths, urls, threads};
}

bool StudySources::query(const QByteArray& user, int studyId)
{
    Result result = Kxg::GetAllFilesOfStudy(user, studyId, dicomFiles, volumeFiles, seriesWithVolumeFile);
    if (result.bad())
        LogFile::errorf("Database query GetAllFilesOfStudy() failed.");
    else
        // They also tell the study's UID, by which its images are asked for next.
        result = corrections.read(studyId);
    if (result.good())
        result = queryImages();
    if (result.bad())
        LogFile::errorf("%s", qUtf8Printable(result.text()));
    return result.good();
}

Result StudySources::queryImages()
{
    QMap<QByteArray, std::shared_ptr<Kxg::SeriesInfo>> series;
    Result result = Kxg::GetSeries(corrections.studyUID(), series);
    mListed.clear();
    mKeys.clear();
    for (const std::shared_ptr<Kxg::SeriesInfo>& info : qAsConst(series)) {
        // An image without UID is known by its path, here as in the tree.
        for (const Kxg::ImageFile& file : info->images) {
            const QByteArray key = file.sopInstanceUID.isEmpty() ? file.path : file.sopInstanceUID;
            mListed.insert(file.path, {info->seriesInstanceUID, key});
            mKeys.insert(key);
        }
    }
    return result;
}

/// Of a file that was registered without SOP Instance UID only the series was said; but by now it may have one that another
/// file was registered with, whose place it must not take.
bool StudySources::isListed(const TagMap& image, const QByteArray& path) const
{
    const auto listed = mListed.constFind(path);
    if (listed == mListed.cend())
        return true;
    const QByteArray sopUID = image.uid(TagMap::ImageLevel);
    return (listed->key == path ? !mKeys.contains(sopUID) : sopUID == listed->key) &&
           (listed->seriesUID.isEmpty() || image.uid(TagMap::SeriesLevel) == listed->seriesUID);
}

/// Of an image that was replaced or taken out its place among the others would still tell.
bool StudySources::isLoadedWhole(const TagFile& loadedBefore) const
{
    const QVector<QByteArray>& added = loadedBefore.addedImages();
    if (loadedBefore.studyInstanceUID() != corrections.studyUID() || !corrections.isEmpty() ||
        !adopted->undecided().isEmpty() || added.size() != loadedBefore.imagesByUID().size() ||
        static_cast<std::size_t>(added.size()) != dicomFiles.size())
        return false;
    for (int i = 0; i < added.size(); ++i) {
        const TagMap* image = loadedBefore.findImage(added.at(i));
        if (image == nullptr)
            return false;
        const QByteArray path = filePathOf(*image);
        if (path != dicomFiles[static_cast<std::size_t>(i)].c_str() || !isListed(*image, path))
            return false;
    }
    return true;
}

std::unique_ptr<TagMap> StudySources::copyFormer(const std::string& path) const
{
    const QByteArray name = QByteArray::fromStdString(path);
    const auto listed = mListed.constFind(name);
    // It may have come from another file of the same image so far.
    const TagMap* sameImage = listed != mListed.cend() ? former.findImage(listed->key) : nullptr;
    std::unique_ptr<TagMap> image =
        formerImages.copy(sameImage != nullptr ? filePathOf(*sameImage).toStdString() : path);
    if (image == nullptr)
        return nullptr;
    corrections.applyToFormer(*image);
    const QByteArray sopUID = image->uid(TagMap::ImageLevel);
    // Only now, since corrections may have given it another UID.
    if (listed != mListed.cend() && (sopUID.isEmpty() ? name : sopUID) != listed->key)
        return nullptr;
    return image;
}

/// A study that has no tag file yet, or a damaged one, has nothing to keep.
bool StudySources::readFormer()
{
    const QByteArray& studyUID = corrections.studyUID();
    bool isRead = false;
    for (int i = 0; i < kReadingAttempts && !isRead && (i == 0 || former.wasLockedOut()); ++i)
        isRead = former.readCacheFileForStudy(studyUID.constData(), false);
    // An empty one counts as just being made; whoever made it is dead, for a build has the study to itself.
    const bool isEmpty =
        presenceOf(TagFile::cacheFilePathForStudy(studyUID.constData())) == FilePresence::Empty;
    if (!isRead && former.wasLockedOut() && !isEmpty) {
        LogFile::errorf("The tag file of study %s cannot be read: others hold it", studyUID.constData());
        return false;
    }
    formerImages = ImagesByPath(former);
    return true;
}

bool StudySources::collect(const QByteArray& user, int studyId)
{
    if (!query(user, studyId) || !readFormer())
        return false;
    QSet<QByteArray> listed;
    for (const std::string& path : dicomFiles)
        listed.insert(QByteArray::fromStdString(path));
    adopted = std::make_unique<AdoptedCorrections>(former.imagesByUID(), corrections, listed);
    const Result result = adopted->record();
    if (result.bad()) {
        LogFile::errorf("The corrections of study %s cannot be kept: %s", corrections.studyUID().constData(),
                        qUtf8Printable(result.text()));
        return false;
    }
    // What was recorded may list files in other studies and series, so the study is asked for again.
    if (adopted->isAny() && !query(user, studyId))
        return false;
    // Sorted, because a set has no order and a build makes the same of the same files.
    QList<QByteArray> unlisted = (adopted->undecided() - listed).values();
    std::sort(unlisted.begin(), unlisted.end());
    for (const QByteArray& path : qAsConst(unlisted))
        dicomFiles.push_back(path.toStdString());
    return true;
}

}  // namespace Kdd
