#include "kddlib/tagfile/TagFile.h"

#include "kddlib/Limits.h"
#include "kddlib/items/FileNaming.h"
#include "kddlib/net/dicom/KxDcmFileLoader.h"
#include "kddlib/tagfile/NodeAttributes.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/base/Stopwatch.h"
#include "platform/database/StorageManager.h"
#include "platform/resources/ExResource.h"

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcfilefo.h>

#include <algorithm>
#include <mutex>
#include <tuple>

namespace Kdd
{

namespace
{

/// The caller's UIDs may be those of the very nodes that are removed.
std::vector<QByteArray> textsOf(int count, const char** texts)
{
    return count > 0 ? std::vector<QByteArray>(texts, texts + count) : std::vector<QByteArray>();
}

}  // namespace

TagFile::CompressionMode TagFile::sCompressionMode = CompressionMode::Zlib;
Vec2i TagFile::sPreviewSize = {256, 256};
unsigned int TagFile::sDebugOptions = 0;
QByteArray TagFile::sMetaFolder;
TagFile::Durability TagFile::sDurability = Durability::Process;

TagFile::~TagFile()
{
    clear();
}

const char* TagFile::metaFolder()
{
    // A program that only has the C functions cannot set the folder at its start: threads may come here together.
    static std::mutex mutex;
    const std::lock_guard<std::mutex> lock(mutex);
    if (!sMetaFolder.isEmpty())
        return sMetaFolder.constData();
    QByteArray configured = ExResource::metaFolder();
    if (configured.isEmpty())
        configured = Kxg::StorageManager::getMetaFolder();
    // Not kept: a database that cannot be asked now may answer the next time.
    if (configured.isEmpty())
        return "./";
    setMetaFolder(configured.constData());
    return sMetaFolder.constData();
}

void TagFile::setMetaFolder(const char* path)
{
    sMetaFolder = QByteArray(path);
    sMetaFolder.replace('\\', '/');
    if (sMetaFolder.isEmpty())
        sMetaFolder = ".";
    if (!sMetaFolder.endsWith('/'))
        sMetaFolder.append('/');
    // A host that logs everything through a callback of its own would get the line before it is ready for lines.
    if (LogFile::level() != LogFile::Level::Everything || !LogFile::hasCallback())
        LogFile::printf("Meta folder set to %s", sMetaFolder.constData());
}

QByteArray TagFile::imageKey(const TagMap& image)
{
    const QByteArray sopUID = image.uid(TagMap::ImageLevel);
    return sopUID.isEmpty() ? forwardSlashes(filePathOf(image)) : sopUID;
}

TagMap* TagFile::addTagMap(TagMap* map, const char* path, bool replace)
{
    std::unique_ptr<TagMap> image(map);
    // The path may be what the image says that is about to be replaced.
    const QByteArray givenPath(path);
    const QByteArray studyUID = image->uid(TagMap::StudyLevel);
    const QByteArray seriesUID = image->uid(TagMap::SeriesLevel);
    QByteArray key = imageKey(*image);
    const bool isKnownByPath = key.isEmpty() && path != nullptr;
    if (isKnownByPath)
        key = forwardSlashes(givenPath);
    if (key.isEmpty() || (!mStudies.isEmpty() && mStudies.firstKey() != studyUID))
        return nullptr;
    if (TagMap* old = mImages.find(key)) {
        if (old == map)
            return image.release();
        if (!replace)
            return nullptr;
        replaceImage(old, *image, seriesUID);
    }
    dropOfTheNode(*image);
    mImages.insert(key, image.get());
    placeInSeries(image.get(), seriesUID, studyUID);
    if (path != nullptr)
        image->putAndInsertValue(kFileSuffix, VrCode::LO, extractSuffix(givenPath.constData()));
    if (isKnownByPath)
        image->putAndInsertValue(kFilePath, VrCode::LO, givenPath);
    return image.release();
}

/// In its series the new image takes the old one's places in the volumes, which know their images by UID.
void TagFile::replaceImage(TagMap* old, TagMap& image, const QByteArray& seriesUID)
{
    TagMap* series = old->parent();
    const bool staysInSeries = series != nullptr && series == findSeries(seriesUID);
    if (staysInSeries)
        image.takeVolumePlaces(*old);
    delete old;
    if (series != nullptr && series->children().isEmpty() && !staysInSeries)
        dropSeries(series);
}

void TagFile::placeInSeries(TagMap* image, const QByteArray& seriesUID, const QByteArray& studyUID)
{
    if (TagMap* series = mSeries.value(seriesUID, nullptr)) {
        attachBelow(*series, image, TagMap::ImageLevel);
        return;
    }
    auto* series = new TagMap;
    mSeries.insert(seriesUID, series);
    attachBelow(*series, image, TagMap::ImageLevel);
    std::shared_ptr<TagMap>& study = mStudies[studyUID];
    if (study == nullptr)
        study = std::make_shared<TagMap>();
    holdInSeries(*study);
    attachBelow(*study, series, TagMap::SeriesLevel);
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
    return mSeries.value(seriesUID, nullptr);
}

TagMap* TagFile::findImage(const QByteArray& sopUID) const
{
    TagMap* image = mImages.find(sopUID);
    // The path of an image without UID, as it was given.
    return image != nullptr || !sopUID.contains('\\') ? image : mImages.find(forwardSlashes(sopUID));
}

TagMap* TagFile::findImage(const QByteArray& sopUID, const QByteArray& suffix) const
{
    TagMap* image = findImage(sopUID);
    if (image == nullptr || suffix.isEmpty())
        return image;
    const TagElement* held = image->findElement(kFileSuffix);
    return held == nullptr || held->value() == suffix ? image : nullptr;
}

TagMap* TagFile::takeImage(const QByteArray& sopUID)
{
    TagMap* image = findImage(sopUID);
    if (image == nullptr)
        return nullptr;
    TagMap* copy = image->clone();
    mImages.remove(image, sopUID);
    delete image;
    return copy;
}

int TagFile::removeImages(int count, const char** sopUIDs)
{
    int removed = 0;
    for (const QByteArray& sopUID : textsOf(count, sopUIDs)) {
        TagMap* image = findImage(sopUID);
        TagMap* series = image != nullptr ? image->parent() : nullptr;
        if (series == nullptr)
            continue;
        mImages.remove(image, sopUID);
        delete image;
        ++removed;
        TagMap* study = series->parent();
        if (series->children().isEmpty() && study != nullptr) {
            dropSeries(series);
            dropStudyIfEmpty(study);
        }
    }
    return removed;
}

int TagFile::removeSeries(int count, const char** seriesUIDs)
{
    int removed = 0;
    for (const QByteArray& seriesUID : textsOf(count, seriesUIDs)) {
        TagMap* series = findSeries(seriesUID);
        if (series == nullptr)
            continue;
        for (TagMap* image : series->children())
            mImages.remove(image, imageKey(*image));
        TagMap* study = series->parent();
        dropSeries(series);
        ++removed;
        if (study != nullptr)
            dropStudyIfEmpty(study);
    }
    return removed;
}

void TagFile::removeImagesWithoutFilename(TagMap* series)
{
    for (int i = series->children().size() - 1; i >= 0; --i) {
        TagMap* image = series->children().at(i);
        if (!image->tagsForLevel().contains(kFilePath))
            dropImage(image);
    }
}

void TagFile::dropImage(TagMap* image)
{
    mImages.remove(image, imageKey(*image));
    delete image;
}

/// A node that is deleted takes itself out of its parent. What it says of its UID may have changed since it was indexed.
void TagFile::dropSeries(TagMap* series)
{
    const QByteArray uid = series->uid(TagMap::SeriesLevel);
    mSeries.remove(mSeries.value(uid, nullptr) == series ? uid : mSeries.key(series));
    delete series;
}

void TagFile::dropStudyIfEmpty(TagMap* study)
{
    if (!study->children().isEmpty())
        return;
    const auto holds = [study](const std::shared_ptr<TagMap>& each) { return each.get() == study; };
    const auto at = std::find_if(mStudies.begin(), mStudies.end(), holds);
    if (at != mStudies.end())
        mStudies.erase(at);
}

void TagFile::deleteEmptyNodes()
{
    for (auto it = mSeries.begin(); it != mSeries.end();) {
        if (it.value()->children().isEmpty()) {
            delete it.value();
            it = mSeries.erase(it);
        } else {
            ++it;
        }
    }
    for (auto it = mStudies.begin(); it != mStudies.end();) {
        if (it.value()->children().isEmpty())
            it = mStudies.erase(it);
        else
            ++it;
    }
}

void TagFile::optimizeAll()
{
    if (debugOption(kMeasureUnoptimised))
        mStatistics.unoptimisedSize = serialized(CompressionMode::None).size();
    const Stopwatch stopwatch;
    for (TagMap* series : qAsConst(mSeries))
        series->optimizeAll();
    for (const std::shared_ptr<TagMap>& study : qAsConst(mStudies))
        study->optimizeAll();
    deleteEmptyNodes();
    mStatistics.optimiseMs = stopwatch.elapsed();
}

void TagFile::clear()
{
    mSeries.clear();
    mImages = {};
    mStudies.clear();
    // The times of reading and writing tell of the file, not of what is held.
    Statistics cleared;
    cleared.readMs = mStatistics.readMs;
    cleared.writeMs = mStatistics.writeMs;
    mStatistics = cleared;
}

QByteArray TagFile::studyInstanceUID() const
{
    return mStudies.isEmpty() ? QByteArray() : mStudies.firstKey();
}

std::shared_ptr<TagMap> TagFile::study() const
{
    return mStudies.isEmpty() ? nullptr : mStudies.first();
}

TagFile::Statistics TagFile::statistics() const
{
    Statistics statistics = mStatistics;
    statistics.series = mSeries.size();
    statistics.images = mImages.inOrder().size();
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

}  // namespace Kdd
