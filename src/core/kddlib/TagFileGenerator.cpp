#include "kddlib/TagFileGenerator.h"

#include "kddlib/Limits.h"
#include "kddlib/StudySources.h"
#include "kddlib/net/dicom/KxDcmFileLoader.h"
#include "kddlib/net/dicom/RemoteDicom.h"
#include "kddlib/net/http/ObjectAddress.h"
#include "kddlib/tagfile/CorrectedVolumes.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagfile/TagFileRemoval.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"
#include "kddlib/volumes/VolumeFileOpening.h"
#include "kddlib/volumes/VolumeInfo.h"
#include "platform/base/LogFile.h"
#include "platform/volumefile/OrlanMesh.h"

#include <QMap>
#include <QSet>
#include <QThread>

#include <dcmtk/dcmdata/dcfilefo.h>

namespace Kdd
{

namespace
{

const char* const kDefaultUser = "zp_administrator";

const char* const kSeriesInstanceUID = "G0020-000E";

/// Of two minutes in all, for a removal does not wait itself.
constexpr int kRemovalAttempts = 6000;
constexpr unsigned long kRemovalPause = 20;  // [ms]

constexpr char kForeign[] = "File %s does not belong to study %s";

const char* userOrDefault(const char* user)
{
    return user != nullptr ? user : kDefaultUser;
}

}  // namespace

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
    TagFile nothing;
    return createTagFile(tagFile, studyId, studyInstanceUID, nothing);
}

bool TagFileGenerator::createTagFile(TagFile& tagFile, int studyId, const char* studyInstanceUID,
                                     TagFile& loaded)
{
    mLoadWatch = mVolumeWatch = mPreviewWatch = {};
    mNumKept = mNumMissing = 0;
    tagFile.clear();
    // Images come first, for volumes and previews are made of what the tree then holds. Labels and placement
    // come last, when nothing is added any more.
    StudySources sources(loaded);
    if (!sources.collect(mUser, studyId))
        return false;
    if (sources.isLoadedWhole(loaded))
        tagFile.takeTree(loaded);
    else
        addFiles(tagFile, studyInstanceUID, sources);
    addVolumes(tagFile, sources.volumeFiles, sources);
    // After the volumes, because an image that a volume shows gets no preview of its own.
    QList<QByteArray> chosen;
    tagFile.selectPreviewImages2D(chosen);
    addPreviews(tagFile, chosen, sources);
    finishTree(tagFile);
    for (const std::string& uid : sources.seriesWithVolumeFile) {
        if (TagMap* series = tagFile.findSeries(QByteArray::fromStdString(uid)))
            series->putAndInsertInt(kHasVolumeFile, 1);
    }
    return write(tagFile, sources);
}

bool TagFileGenerator::write(TagFile& tagFile, StudySources& sources)
{
    if (tagFile.isEmpty() && sources.dicomFiles.empty()) {
        // Its images were moved away, and a volume file alone shows nothing.
        const Result removed = removeTagFile(sources.corrections.studyUID());
        if (removed.bad())
            LogFile::errorf("%s", qUtf8Printable(removed.text()));
        return removed.good();
    }
    if (!tagFile.writeCacheFile())
        return false;
    // The study is as it should be already; at worst it is built once more.
    const Result result = sources.adopted->finish();
    if (result.bad())
        LogFile::warnf("%s", qUtf8Printable(result.text()));
    return true;
}

Result TagFileGenerator::removeTagFile(const QByteArray& studyInstanceUID)
{
    const QString path = TagFile::cacheFilePathForStudy(studyInstanceUID.constData());
    for (int i = 0; i < kRemovalAttempts; ++i) {
        if (removeTagFileOnce(path).good())
            return {};
        QThread::msleep(kRemovalPause);
    }
    return Result::failure(QStringLiteral("The tag file of study %1 cannot be removed: others hold it")
                               .arg(QString::fromUtf8(studyInstanceUID)));
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
            // Clones, because the arrivals are still to be merged; here they only count for the choice.
            present.addTagMap(image->clone(), nullptr, true);
        present.selectPreviewImages2D(chosen);
    }
    addPreviews(arrivals, chosen, StudySources(TagFile()));
    finishTree(arrivals);
}

void TagFileGenerator::finishTree(TagFile& tagFile) const
{
    tagFile.createAbstractTags();
    if (mOptimize)
        tagFile.optimizeAll();
}

void TagFileGenerator::addFiles(TagFile& tagFile, const char* studyInstanceUID, StudySources& sources)
{
    // Its threads end here, before pictures are made.
    ImagesAhead ahead = sources.readAhead(mReaders);
    for (const std::string& path : sources.dicomFiles)
        addFile(tagFile, path, studyInstanceUID, sources, ahead);
}

/// From the file, and where that cannot be read from the former tag file: an image is not lost
/// because its file is out of reach for a while.
void TagFileGenerator::addFile(TagFile& tagFile, const std::string& path, const char* studyInstanceUID,
                               StudySources& sources, ImagesAhead& ahead)
{
    const QByteArray name = QByteArray::fromStdString(path);
    // Where it cannot be decided which corrections hold, the image stays as
    // the tag file has it and its file is not read.
    const bool isUndecided = sources.adopted->undecided().contains(name);
    std::unique_ptr<TagMap> image =
        isUndecided ? nullptr : readListed(path, studyInstanceUID, sources, ahead);
    if (image == nullptr) {
        image = isUndecided ? sources.formerImages.copy(path) : sources.copyFormer(path);
        if (!isUndecided)
            ++(image != nullptr ? mNumKept : mNumMissing);
        if (image == nullptr)
            return;
        sources.kept.insert(name);
        if (isUndecided)
            sources.corrections.applyToFormer(*image);
    }
    addImage(tagFile, std::move(image), path, studyInstanceUID);
}

/// The image that the database lists for the file, as corrections make it; null, with the reason logged, when the file
/// has no such image.
std::unique_ptr<TagMap> TagFileGenerator::readListed(const std::string& path, const char* studyInstanceUID,
                                                     StudySources& sources, ImagesAhead& ahead)
{
    const QByteArray name = QByteArray::fromStdString(path);
    std::unique_ptr<TagMap> image = sources.loaded.copy(path);
    if (image == nullptr)
        image = load(path, sources, ahead);
    if (image == nullptr || !sources.corrections.applyTo(*image, name))
        return nullptr;
    // After the corrections, for one may have moved the image here from the study that its file names.
    if (studyInstanceUID != nullptr && image->uid(TagMap::StudyLevel) != studyInstanceUID) {
        LogFile::warnf(kForeign, shownAddress(name).constData(), studyInstanceUID);
        return nullptr;
    }
    if (!sources.isListed(*image, name)) {
        LogFile::errorf("%s is not the image that was registered any more", shownAddress(name).constData());
        return nullptr;
    }
    return image;
}

/// The image as the file has it; null, with the reason logged, when it cannot be read.
std::unique_ptr<TagMap> TagFileGenerator::load(const std::string& path, StudySources& sources,
                                               ImagesAhead& ahead)
{
    const StopwatchSum::Running running(mLoadWatch);
    const QByteArray name = QByteArray::fromStdString(path);
    ObjectRead object;
    if (std::unique_ptr<TagMap> image = ahead.take(name, object))
        return image;
    DcmFileFormat file;
    OFCondition condition = conditionOf(object.fault);
    if (object.file != nullptr)
        condition = readRemoteDicom(object.file, file);
    else if (object.fault.good())
        condition = loadDicomFile(path.c_str(), file);
    if (condition.bad()) {
        LogFile::errorf("Could not open %s: %s", shownAddress(name).constData(), condition.text());
        return nullptr;
    }
    std::unique_ptr<TagMap> image(TagMap::createTagMap(file.getDataset(), kDefaultValueBound));
    // One that comes by ranges keeps what was fetched last, and is not kept itself.
    if (object.file == nullptr)
        sources.datasets.keep(name, std::unique_ptr<DcmDataset>(file.getAndRemoveDataset()));
    return image;
}

/// False, with the reason logged, when the image belongs to another study.
bool TagFileGenerator::addImage(TagFile& tagFile, std::unique_ptr<TagMap> image, const std::string& path,
                                const char* studyInstanceUID)
{
    const bool isForeign = studyInstanceUID != nullptr && tagFile.isEmpty() &&
                           image->uid(TagMap::StudyLevel) != studyInstanceUID;
    const QByteArray name = QByteArray::fromStdString(path);
    const int before = tagFile.imagesByUID().size();
    if (isForeign || place(tagFile, std::move(image), name) == nullptr) {
        LogFile::warnf(kForeign, shownAddress(name).constData(),
                       studyInstanceUID != nullptr ? studyInstanceUID
                                                   : tagFile.studyInstanceUID().constData());
        return false;
    }
    if (tagFile.imagesByUID().size() == before)
        LogFile::warnf("%s replaces another file of the same SOP Instance UID",
                       shownAddress(name).constData());
    return true;
}

TagMap* TagFileGenerator::place(TagFile& tagFile, std::unique_ptr<TagMap> image, const QByteArray& path)
{
    TagMap* placed = tagFile.addTagMap(image.release(), path.constData(), true);
    // Who reads the tag file finds the image without asking the database; a sync keeps the path up to date.
    if (placed != nullptr)
        placed->putAndInsertValue(kFilePath, VrCode::LO, path);
    return placed;
}

void TagFileGenerator::addVolumeInfo(TagFile& tagFile, const std::vector<std::string>& volumeFiles)
{
    StudySources nothingElse((TagFile()));
    addVolumes(tagFile, volumeFiles, nothingElse);
}

/// Volumes that are whole come first: the parts of others are numbered behind them.
void TagFileGenerator::addVolumes(TagFile& tagFile, const std::vector<std::string>& volumeFiles,
                                  StudySources& sources)
{
    const CorrectedVolumes corrected(tagFile, sources.corrections);
    QMap<QByteArray, std::vector<VolumeInfo*>> infosBySeries;
    std::vector<std::unique_ptr<VolumeInfo>> divided;
    QSet<QByteArray> unreadable;  // suffixes
    for (const std::string& path : volumeFiles) {
        QByteArray seriesUID;
        std::unique_ptr<VolumeInfo> info(createVolumeInfo(path.c_str(), seriesUID));
        const QByteArray name = QByteArray::fromStdString(path);
        if (info == nullptr) {
            // The suffix is all that tells the volume of a file that cannot be read.
            unreadable.insert(Volume::fileNameSuffix(name.mid(name.lastIndexOf('/') + 1).constData()));
            continue;
        }
        const auto fate = corrected.update(*info, sources.corrections.isForeign(name));
        const QByteArray holder = corrected.seriesOf(*info);
        if (fate == CorrectedVolumes::Fate::Divided)
            divided.push_back(std::move(info));
        else if (fate == CorrectedVolumes::Fate::Whole)
            infosBySeries[holder.isEmpty() ? seriesUID : holder].push_back(info.release());
    }
    for (const std::vector<VolumeInfo*>& infos : qAsConst(infosBySeries)) {
        tagFile.addVolumeInfo(infos);
        qDeleteAll(infos);
    }
    for (const std::unique_ptr<VolumeInfo>& info : divided)
        tagFile.addDividedVolume(*info);
    if (!unreadable.isEmpty())
        tagFile.keepVolumesOf(sources.former, unreadable);
}

VolumeInfo* TagFileGenerator::createVolumeInfo(const char* path, QByteArray& seriesInstanceUID)
{
    const StopwatchSum::Running running(mVolumeWatch);
    Result result;
    const std::unique_ptr<OrlanMesh> mesh = openVolumeFile(path, result);
    if (mesh == nullptr) {
        LogFile::errorf("%s", qUtf8Printable(result.text()));
        return nullptr;
    }
    auto info = std::make_unique<VolumeInfo>();
    seriesInstanceUID = dicomValue(*mesh, kSeriesInstanceUID);
    if (!info->readHeader(*mesh, path))
        return nullptr;
    addPreview(*mesh, path, *info);
    return info.release();
}

}  // namespace Kdd
