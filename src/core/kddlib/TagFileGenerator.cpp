#include "kddlib/TagFileGenerator.h"

#include "kddlib/Limits.h"
#include "kddlib/net/KxCurlClient.h"
#include "kddlib/net/KxDcmFileLoader.h"
#include "kddlib/net/KxHttpStatus.h"
#include "kddlib/previews/PreviewGenerator.h"
#include "kddlib/previews/QuadrantNavigation.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/VolumeInfo.h"
#include "platform/base/LogFile.h"
#include "platform/database/Kxg.h"
#include "platform/os/PathName.h"
#include "platform/volumefile/OrlanMesh.h"

#include <QHash>
#include <QMap>

#include <dcmtk/dcmdata/dcfilefo.h>

#include <exception>
#include <map>

namespace Kdd
{

namespace
{

const char* const kDefaultUser = "zp_administrator";

const char* const kSeriesInstanceUID = "G0020-000E";
const char* const kModality = "G0008-0060";
const char* const kMammography = "MG";

const char* userOrDefault(const char* user)
{
    return user != nullptr ? user : kDefaultUser;
}

/// False, with the reason logged, when the bytes cannot be had.
bool download(const char* url, QByteArray& bytes)
{
    KxHttpStatus status;
    try {
        bytes = KxCurlClient::instance().readBytes(url, status);
    } catch (const std::exception& fault) {
        LogFile::errorf("Reading %s failed: %s", url, fault.what());
        return false;
    }
    if (status.failed)
        LogFile::errorf("Reading %s failed: %s", url, status.failure.c_str());
    else if (!status.ok())
        LogFile::errorf("Reading %s failed: HTTP response code %d", url, status.code);
    return status.ok();
}

/// Null, with the reason logged, when there is no usable volume file.
std::unique_ptr<OrlanMesh> openVolume(const char* path)
{
    Result result;
    std::unique_ptr<OrlanMesh> mesh;
    QByteArray bytes;
    if (!KxCurlClient::isUrl(path))
        mesh = OrlanMesh::read(QByteArray(path), result);
    else if (download(path, bytes))
        mesh = OrlanMesh::read(bytes, path, result);
    if (result.bad())
        LogFile::errorf("%s", qUtf8Printable(result.text()));
    return mesh;
}

}  // namespace

/// The datasets of a study as they were loaded, for the previews that are chosen once all are known. A dataset costs a
/// hundred times what its tag map costs, so of large studies only the first are kept; the others are loaded again when
/// they are chosen.
class TagFileGenerator::KeptDatasets
{
public:
    void keep(const QByteArray& sopUID, std::unique_ptr<DcmDataset> dataset)
    {
        // Of several files of one image the last one counts.
        mDatasets.erase(sopUID);
        if (mDatasets.size() < kMaxDatasets)
            mDatasets.emplace(sopUID, std::move(dataset));
    }

    /// Null when it is not kept.
    DcmDataset* find(const QByteArray& sopUID) const
    {
        const auto it = mDatasets.find(sopUID);
        return it != mDatasets.end() ? it->second.get() : nullptr;
    }

private:
    static constexpr std::size_t kMaxDatasets = 500;

    std::map<QByteArray, std::unique_ptr<DcmDataset>> mDatasets;
};

/// Images that were loaded before the building began, by their paths.
class TagFileGenerator::LoadedImages
{
public:
    explicit LoadedImages(const TagFile& file)
    {
        for (const TagMap* image : file.imagesByUID())
            mImages.insert(filePathOf(*image), image);
    }

    /// The image as it comes from the file; null when the file at the path is not among them.
    std::unique_ptr<TagMap> copy(const std::string& path) const
    {
        const TagMap* image = mImages.value(QByteArray::fromStdString(path), nullptr);
        std::unique_ptr<TagMap> copy(image != nullptr ? image->clone() : nullptr);
        if (copy == nullptr)
            return nullptr;
        // Given anew when it is placed: attributes that come along would be placed otherwise than those given then.
        copy->deleteElement(kFilePath);
        copy->deleteElement(kFileSuffix);
        return copy;
    }

private:
    QHash<QByteArray, const TagMap*> mImages;
};

TagFileGenerator::TagFileGenerator()
    : TagFileGenerator(nullptr, true)
{
}

TagFileGenerator::TagFileGenerator(const char* user, bool optimize)
    : mUser(userOrDefault(user))
    , mOptimize(optimize)
{
}

void TagFileGenerator::setOptions(const char* user, bool optimize)
{
    mUser = userOrDefault(user);
    mOptimize = optimize;
}

void TagFileGenerator::getTimings(int& loadMs, int& volumeMs, int& previewMs) const
{
    loadMs = mLoadWatch.elapsed();
    volumeMs = mVolumeWatch.elapsed();
    previewMs = mPreviewWatch.elapsed();
}

bool TagFileGenerator::createTagFile(int studyId)
{
    TagFile tagFile;
    return createTagFile(tagFile, studyId, nullptr);
}

bool TagFileGenerator::createTagFile(TagFile& tagFile, int studyId, const char* studyInstanceUID)
{
    return createTagFile(tagFile, studyId, studyInstanceUID, TagFile());
}

bool TagFileGenerator::createTagFile(TagFile& tagFile, int studyId, const char* studyInstanceUID,
                                     const TagFile& loaded)
{
    mLoadWatch = mVolumeWatch = mPreviewWatch = {};
    tagFile.clear();
    std::vector<std::string> dicomFiles;
    std::vector<std::string> volumeFiles;
    std::vector<std::string> seriesWithVolumeFile;
    const Result query =
        Kxg::GetAllFilesOfStudy(mUser, studyId, dicomFiles, volumeFiles, seriesWithVolumeFile);
    if (query.bad()) {
        LogFile::errorf("Database query GetAllFilesOfStudy() failed.");
        LogFile::errorf("%s", qUtf8Printable(query.text()));
        return false;
    }
    KeptDatasets datasets;
    const LoadedImages images(loaded);
    for (const std::string& path : dicomFiles) {
        if (std::unique_ptr<TagMap> image = images.copy(path))
            addImage(tagFile, std::move(image), path, studyInstanceUID);
        else
            addDicomFile(tagFile, path, studyInstanceUID, datasets);
    }
    addVolumeInfo(tagFile, volumeFiles);
    QList<QByteArray> chosen;
    tagFile.selectPreviewImages2D(chosen);
    addPreviews(tagFile, chosen, datasets);
    finishTree(tagFile);
    for (const std::string& uid : seriesWithVolumeFile) {
        if (TagMap* series = tagFile.findSeries(QByteArray::fromStdString(uid)))
            series->putAndInsertInt(kHasVolumeFile, 1);
    }
    return tagFile.writeCacheFile();
}

void TagFileGenerator::completeArrivals(TagFile& arrivals)
{
    TagFile present;
    present.readCacheFileForStudy(arrivals.studyInstanceUID().constData(), false);
    completeArrivals(arrivals, present);
}

void TagFileGenerator::completeArrivals(TagFile& arrivals, TagFile& present)
{
    mLoadWatch = mVolumeWatch = mPreviewWatch = {};
    QList<QByteArray> chosen;
    if (present.isEmpty()) {
        arrivals.selectPreviewImages2D(chosen);
    } else {
        for (const TagMap* image : arrivals.imagesByUID())
            present.addTagMap(image->clone(), nullptr, true);
        present.selectPreviewImages2D(chosen);
    }
    addPreviews(arrivals, chosen, KeptDatasets());
    finishTree(arrivals);
}

void TagFileGenerator::finishTree(TagFile& tagFile) const
{
    tagFile.createAbstractTags();
    if (mOptimize)
        tagFile.optimizeAll();
}

void TagFileGenerator::addDicomFile(TagFile& tagFile, const std::string& path, const char* studyInstanceUID,
                                    KeptDatasets& datasets)
{
    const StopwatchSum::Running running(mLoadWatch);
    DcmFileFormat file;
    const OFCondition condition = loadDicomFile(path.c_str(), file);
    if (condition.bad()) {
        LogFile::errorf("Could not open %s: %s", path.c_str(), condition.text());
        return;
    }
    std::unique_ptr<TagMap> map(TagMap::createTagMap(file.getDataset(), kDefaultValueBound));
    const QByteArray sopUID = map->uid(TagMap::ImageLevel);
    if (addImage(tagFile, std::move(map), path, studyInstanceUID))
        datasets.keep(sopUID, std::unique_ptr<DcmDataset>(file.getAndRemoveDataset()));
}

/// False, with the reason logged, when the image belongs to another study.
bool TagFileGenerator::addImage(TagFile& tagFile, std::unique_ptr<TagMap> image, const std::string& path,
                                const char* studyInstanceUID)
{
    const bool isForeign = studyInstanceUID != nullptr && tagFile.isEmpty() &&
                           image->uid(TagMap::StudyLevel) != studyInstanceUID;
    const int before = tagFile.imagesByUID().size();
    TagMap* placed = isForeign ? nullptr : tagFile.addTagMap(image.release(), path.c_str(), true);
    if (placed == nullptr) {
        LogFile::warnf("File %s does not belong to study %s", path.c_str(),
                       studyInstanceUID != nullptr ? studyInstanceUID
                                                   : tagFile.studyInstanceUID().constData());
        return false;
    }
    if (tagFile.imagesByUID().size() == before)
        LogFile::warnf("%s replaces another file of the same SOP Instance UID", path.c_str());
    // Who reads the tag file finds the image without asking the database; a sync keeps the path up to date.
    placed->putAndInsertValue(kFilePath, VrCode::LO, QByteArray::fromStdString(path));
    return true;
}

/// Of the images chosen those that are held.
void TagFileGenerator::addPreviews(TagFile& tagFile, const QList<QByteArray>& chosen,
                                   const KeptDatasets& datasets)
{
    const StopwatchSum::Running running(mPreviewWatch);
    for (const QByteArray& sopUID : chosen) {
        TagMap* image = tagFile.findImage(sopUID);
        if (image == nullptr)
            continue;
        const QByteArray path = filePathOf(*image);
        if (DcmDataset* dataset = datasets.find(sopUID))
            tagFile.addPreview(image, dataset, pathText(path));
        else
            tagFile.addPreview(image, path);
    }
}

void TagFileGenerator::addVolumeInfo(TagFile& tagFile, const std::vector<std::string>& volumeFiles)
{
    QMap<QByteArray, std::vector<VolumeInfo*>> infosBySeries;
    for (const std::string& path : volumeFiles) {
        QByteArray seriesUID;
        if (VolumeInfo* info = createVolumeInfo(path.c_str(), seriesUID))
            infosBySeries[seriesUID].push_back(info);
    }
    for (const std::vector<VolumeInfo*>& infos : qAsConst(infosBySeries)) {
        tagFile.addVolumeInfo(infos);
        qDeleteAll(infos);
    }
}

VolumeInfo* TagFileGenerator::createVolumeInfo(const char* path, QByteArray& seriesInstanceUID)
{
    const StopwatchSum::Running running(mVolumeWatch);
    const std::unique_ptr<OrlanMesh> mesh = openVolume(path);
    if (mesh == nullptr)
        return nullptr;
    auto info = std::make_unique<VolumeInfo>();
    seriesInstanceUID = dicomValue(*mesh, kSeriesInstanceUID);
    if (!info->readHeader(*mesh, path))
        return nullptr;
    addPreview(*mesh, path, *info);
    return info.release();
}

void TagFileGenerator::addPreview(OrlanMesh& mesh, const char* path, VolumeInfo& info)
{
    const StopwatchSum::Running running(mPreviewWatch);
    const Vec2i size = TagFile::previewSize();
    const QImage image = PreviewGenerator::createPreviewImage(
        &mesh, path, static_cast<unsigned long>(size.x), static_cast<unsigned long>(size.y), info.dims.z / 2);
    if (image.isNull())
        return;
    info.preview = PreviewGenerator::createPreviewData(image);
    if (dicomValue(mesh, kModality) == kMammography)
        info.quadrantData = QuadrantNavigation::computeImageBoxAndCenter(
            image, QuadrantNavigation::checkOrientation(mesh.parameters().bundle("DICOM")));
}

}  // namespace Kdd
