#include "kddlib/tagfile/TagFile.h"

#include "kddlib/Limits.h"
#include "kddlib/items/kdditemtm.h"
#include "kddlib/net/dicom/KxDcmFileLoader.h"
#include "kddlib/tagfile/DatabaseSync.h"
#include "kddlib/tagfile/DatabaseValues.h"
#include "kddlib/tagfile/SeriesLabels.h"
#include "kddlib/tagfile/SeriesRecord.h"
#include "kddlib/tagfile/StoredStudy.h"
#include "kddlib/tagfile/StudyPreviews.h"
#include "kddlib/tagfile/StudyRecord.h"
#include "kddlib/tagfile/StudyVolumes.h"
#include "kddlib/tagfile/qa/QAJob.h"
#include "kddlib/tagfile/qa/QAVolumes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/os/PathName.h"

#include <dcmtk/dcmdata/dcfilefo.h>

#include <tuple>

namespace Kdd
{

struct TagFile::Private
{
    /// Keeps why an operation failed for whoever asks later.
    bool note(const Result& result)
    {
        last = result;
        return result.good();
    }

    StudyTree& tree() { return study.tree(); }

    StoredStudy study;
    Result last;  // of reading, writing or merging
};

TagFile::TagFile()
    : d(std::make_unique<Private>())
{
}

TagFile::~TagFile() = default;

// ---- the tree

QByteArray TagFile::imageKey(const TagMap& image)
{
    return StudyTree::imageKey(image);
}

TagMap* TagFile::addTagMap(TagMap* map, const char* path, bool replace)
{
    return d->tree().add(map, path, replace);
}

TagMap* TagFile::addDataset(DcmDataset* dataset, const char* path, bool replace)
{
    return addTagMap(TagMap::createTagMap(dataset, kDefaultValueBound), path, replace);
}

TagMap* TagFile::addDicomFile(const char* file, const char* path, bool replace)
{
    DcmFileFormat format;
    const OFCondition condition = loadDicomFile(file, format);
    if (condition.bad()) {
        LogFile::errorf("Could not load %s: %s", file, condition.text());
        return nullptr;
    }
    return addDataset(format.getDataset(), path, replace);
}

TagMap* TagFile::findSeries(const QByteArray& seriesUID) const
{
    return d->tree().findSeries(seriesUID);
}

TagMap* TagFile::findImage(const QByteArray& sopUID) const
{
    return d->tree().findImage(sopUID);
}

TagMap* TagFile::findImage(const QByteArray& sopUID, const QByteArray& suffix) const
{
    return d->tree().findImage(sopUID, suffix);
}

std::shared_ptr<Item> TagFile::findImageEx(const QByteArray& sopUID, const QByteArray& suffix) const
{
    TagMap* image = findImage(sopUID, suffix);
    if (image == nullptr)
        return nullptr;
    // The item shares the study: what it shows must stay when the tag file is cleared or read anew.
    const TagMap* root = image;
    while (root->parent() != nullptr)
        root = root->parent();
    // Found by the node, which takes no look-up of the UID in every node above the image.
    for (const std::shared_ptr<TagMap>& study : d->tree().studies()) {
        if (study.get() == root)
            return std::make_shared<ItemTM>(*image, study);
    }
    return nullptr;
}

TagMap* TagFile::takeImage(const QByteArray& sopUID)
{
    return d->tree().takeImage(sopUID);
}

int TagFile::removeImages(int count, const char** sopUIDs)
{
    return d->tree().removeImages(count, sopUIDs);
}

int TagFile::removeSeries(int count, const char** seriesUIDs)
{
    return d->tree().removeSeries(count, seriesUIDs);
}

void TagFile::removeImagesWithoutFilename(TagMap* series)
{
    d->tree().removeImagesWithoutFilename(*series);
}

void TagFile::deleteEmptyNodes()
{
    d->tree().deleteEmptyNodes();
}

void TagFile::optimizeAll()
{
    d->study.optimizeAll();
}

void TagFile::clear()
{
    d->study.clear();
}

void TagFile::takeTree(TagFile& other)
{
    d->tree() = std::move(other.d->tree());
    other.clear();
}

bool TagFile::isEmpty() const
{
    return d->tree().isEmpty();
}

QByteArray TagFile::studyInstanceUID() const
{
    return d->tree().studyInstanceUID();
}

std::shared_ptr<TagMap> TagFile::study() const
{
    return d->tree().study();
}

const QMap<QByteArray, TagMap*>& TagFile::seriesByUID() const
{
    return d->tree().series();
}

const QMap<QByteArray, TagMap*>& TagFile::imagesByUID() const
{
    return d->tree().images();
}

const QVector<QByteArray>& TagFile::addedImages() const
{
    return d->tree().added();
}

TagFile::Statistics TagFile::statistics() const
{
    const StoredStudy::Figures& figures = d->study.figures();
    const FileSizes& sizes = figures.sizes;
    Statistics statistics;
    statistics.series = seriesByUID().size();
    statistics.images = imagesByUID().size();
    statistics.volumes = sizes.volumes;
    statistics.blobs = sizes.blobs;
    statistics.optimiseMs = figures.optimiseMs;
    statistics.readMs = figures.readMs;
    statistics.writeMs = figures.writeMs;
    statistics.storedSize = sizes.storedSize;
    statistics.uncompressedSize = sizes.uncompressedSize;
    statistics.unoptimisedSize = figures.unoptimisedSize;
    statistics.blobBytes = sizes.blobBytes;
    statistics.missingBlobs = sizes.missingBlobs;
    return statistics;
}

// NOLINTNEXTLINE(readability-function-size)
void TagFile::getStatistics(int& series, int& images, int& volumes, int& blobs, int& optimiseMs, int& readMs,
                            int& writeMs, int& storedSize, int& uncompressedSize, int& unoptimisedSize,
                            int& blobBytes) const
{
    const Statistics all = statistics();
    std::tie(series, images, volumes, blobs, optimiseMs, readMs, writeMs, storedSize, uncompressedSize,
             unoptimisedSize, blobBytes) =
        std::tie(all.series, all.images, all.volumes, all.blobs, all.optimiseMs, all.readMs, all.writeMs,
                 all.storedSize, all.uncompressedSize, all.unoptimisedSize, all.blobBytes);
}

// ---- the file

QString TagFile::cacheFilePath() const
{
    return cacheFilePathForStudy(studyInstanceUID().constData());
}

bool TagFile::readCacheFile(const QString& path, const char* studyUID, bool keepOpen)
{
    return d->note(d->study.read(path, studyUID, keepOpen, StoredStudy::Reader::Ordinary));
}

bool TagFile::readCacheFileForStudy(const char* studyUID, bool keepOpen)
{
    return readCacheFile(cacheFilePathForStudy(studyUID), studyUID, keepOpen);
}

bool TagFile::readWhenFree(const QString& path, const char* studyUID, bool keepOpen)
{
    return d->note(d->study.read(path, studyUID, keepOpen, StoredStudy::Reader::Serving));
}

bool TagFile::readWhenFreeForStudy(const char* studyUID, bool keepOpen)
{
    return readWhenFree(cacheFilePathForStudy(studyUID), studyUID, keepOpen);
}

bool TagFile::readStampedWhenFree(const QString& path, const char* studyUID)
{
    return d->note(d->study.readStamped(path, studyUID));
}

bool TagFile::readCacheFile(QDataStream& in, const char* studyUID)
{
    return d->note(d->study.read(in, studyUID));
}

bool TagFile::writeCacheFile()
{
    return d->note(d->study.write());
}

bool TagFile::writeCacheFile(const char* path)
{
    return d->note(d->study.write(pathText(path)));
}

bool TagFile::writeCacheFile(QDataStream& out)
{
    return d->note(d->study.write(out));
}

bool TagFile::mergeIntoCacheFile()
{
    return d->note(d->study.merge());
}

bool TagFile::close()
{
    if (!d->study.file().isOpen())
        return false;
    d->study.file().close();
    return true;
}

const Kxg::TagFileStamp& TagFile::stamp() const
{
    return d->study.stamp();
}

const QString& TagFile::failure() const
{
    return d->last.text();
}

bool TagFile::wasLockedOut() const
{
    return d->study.wasLockedOut();
}

// Here, because records of studies are a part of tag files and know nothing of the whole.
Kxg::BuiltStudy builtStudy(const TagFile& file)
{
    return builtStudy(file.seriesByUID(), file.stamp());
}

// ---- volumes

void TagFile::addVolumeInfo(const std::vector<VolumeInfo*>& infos)
{
    StudyVolumes::add(d->tree(), infos);
}

void TagFile::createVolumes()
{
    // Volumes come from volume files alone; nothing is left to be made from the images.
}

void TagFile::addDividedVolume(const VolumeInfo& info)
{
    QAVolumes::addDivided(d->tree(), info);
}

void TagFile::keepVolumesOf(TagFile& former, const QSet<QByteArray>& suffixes)
{
    QAVolumes::keep(d->tree(), former.d->tree(), suffixes);
}

// ---- previews

void TagFile::selectPreviewImages2D(QList<QByteArray>& uids) const
{
    uids = selectPreviewImages(d->tree());
}

// NOLINTNEXTLINE(readability-convert-member-functions-to-static): of one form with those that find the image
bool TagFile::addPreview(TagMap* image, DcmDataset* dataset, const QString& path)
{
    return Kdd::addPreview(image, dataset, path);
}

// NOLINTNEXTLINE(readability-convert-member-functions-to-static): the same
bool TagFile::addPreview(TagMap* image, const QByteArray& file)
{
    return Kdd::addPreview(image, file);
}

bool TagFile::addPreview(const QByteArray& sopInstanceUID, const QString& path)
{
    return addPreview(findImage(sopInstanceUID), pathBytes(path));
}

bool TagFile::addPreview(DcmDataset* dataset, const QString& path)
{
    return Kdd::addPreview(d->tree(), dataset, path);
}

int TagFile::exportPreviews(const QString& folder) const
{
    return Kdd::exportPreviews(d->tree(), folder);
}

// ---- corrections

bool TagFile::applyQA(QAData& job, QString& message)
{
    const Result result = QAJob(job, QAJob::Purpose::Apply).run();
    message = result.text();
    return result.good();
}

bool TagFile::previewQA(QAData& job, QString& message)
{
    const Result result = QAJob(job, QAJob::Purpose::Preview).run();
    message = result.text();
    return result.good();
}

void TagFile::updateVolumesAfterQA(QASeriesMove& move)
{
    QAVolumes::giveBack(d->tree(), move);
}

// ---- the image database

int TagFile::addDicomFilePaths(TagMap* series, const Kxg::SeriesInfo* info, bool createMissing,
                               bool& complete)
{
    return DatabaseValues(d->tree()).addFilePaths(series, info, createMissing, complete);
}

void TagFile::addVolumeFilePath(TagMap* series, const Kxg::DicomDirectoryEntry& entry, bool createMissing)
{
    DatabaseValues::addVolumeFilePath(series, entry, createMissing);
}

void TagFile::copyDatabaseValuesIntoTagMap(const Kxg::DicomDirectoryEntry& entry)
{
    DatabaseValues(d->tree()).copyStudy(entry);
}

void TagFile::createAbstractTags()
{
    createLabels(d->tree());
}

bool TagFile::readAndSync(const char* studyUID, const char* /*user*/)
{
    return Kdd::readAndSync(d->study, studyUID, d->last);
}

bool TagFile::syncWithDatabase(const std::shared_ptr<Kxg::DicomDirectoryEntry>& study)
{
    return Kdd::syncWithDatabase(d->tree(), study);
}

}  // namespace Kdd
