#include "kddlib/tagfile/NodeAttributes.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/os/ExclusiveFile.h"
#include "platform/os/JournaledWrite.h"
#include "platform/os/PathName.h"

#include <QDataStream>
#include <QFileInfo>

#include <algorithm>
#include <utility>

namespace Kdd
{

namespace
{

const char* const kCategory = "TagMerge";

constexpr LockPolling kMergePolling{100, 20};

bool isLabelled(const TagMap* series)
{
    return series->findElement(kAbstract) != nullptr;
}

/// The mark was made by whoever built the file from the database, which knows more than the images tell.
void keepVolumeFileMark(const TagMap& from, TagMap& to)
{
    const TagElement* mark = from.findElement(kHasVolumeFile);
    if (mark != nullptr && to.findElement(kHasVolumeFile) == nullptr)
        to.putElement(kHasVolumeFile, mark->clone());
}

}  // namespace

bool TagFile::mergeIntoCacheFile()
{
    mFailure.clear();
    mLockedOut = false;
    if (isEmpty()) {
        LogFile::tracef(2, kCategory, "No images, cannot update tag file");
        return fail(QStringLiteral("No images, cannot update tag file"));
    }
    const QByteArray studyUID = studyInstanceUID();
    const QString path = cacheFilePathForStudy(studyUID.constData());
    QFile file;
    if (!openForMerge(file, path))
        return false;
    if (file.size() == 0)
        return writeInto(file, path, false);
    Indexes fresh;
    swapIndexes(fresh);
    if (!readForMerge(file, path, studyUID)) {
        swapIndexes(fresh);
        return false;
    }
    mergeFresh(fresh);
    return writeInto(file, path, false);
}

/// Opens the study's file exclusively, made with its folder when it is missing.
bool TagFile::openForMerge(QFile& file, const QString& path)
{
    LockedOpenResult opened =
        openLockedFile(file, path, FileLock::Exclusive, IfAbsent::Create, kMergePolling);
    const QString folder = QFileInfo(path).path();
    // Another process may make the folder between the two questions, so what was not found is tried again anyhow.
    if (!opened && opened.failure != OpenFailure::Locked) {
        if (!makeFolder(folder))
            return failMerge(QString::asprintf("Could not create meta folder %s", qUtf8Printable(folder)));
        opened = openLockedFile(file, path, FileLock::Exclusive, IfAbsent::Create, kMergePolling);
    }
    mLockedOut = opened.failure == OpenFailure::Locked;
    if (!opened)
        return failMerge(QString::asprintf("Could not open %s for read-write: error code %lu",
                                           qUtf8Printable(path),
                                           static_cast<unsigned long>(opened.systemError)));
    const QString reason = recoverInterruptedWrite(file, path, flushing());
    return reason.isEmpty() || failMerge(reason);
}

/// Reads the file into the object, which is left empty on failure.
bool TagFile::readForMerge(QFile& file, const QString& path, const QByteArray& studyUID)
{
    QDataStream in(&file);
    if (readCacheFile(in, studyUID.constData()))
        return true;
    // The reader passes other studies over; only reading without asking for one tells that there is another.
    file.seek(0);
    QDataStream again(&file);
    const bool holdsAnother = readCacheFile(again, nullptr);
    clear();
    const QByteArray name = pathBytes(path);
    return failMerge(holdsAnother ? QString::asprintf("Tag file %s contains wrong study, expected %s",
                                                      name.constData(), studyUID.constData())
                                  : QString::asprintf("Could not read tag file %s", name.constData()));
}

void TagFile::mergeFresh(const Indexes& fresh)
{
    TagMap& study = *mStudies.first();
    TagMap& freshStudy = *fresh.studies.first();
    const bool hasLabels = std::any_of(fresh.series.cbegin(), fresh.series.cend(), isLabelled) ||
                           std::any_of(mSeries.cbegin(), mSeries.cend(), isLabelled);
    holdInSeries(freshStudy);
    holdInSeries(study);
    for (auto it = fresh.series.cbegin(); it != fresh.series.cend(); ++it)
        mergeSeries(it.value(), it.key(), freshStudy, study);
    deleteEmptyNodes();
    // Labels are distinct only among the series that were known when they were made.
    if (hasLabels)
        createAbstractTags();
    for (auto it = fresh.series.cbegin(); it != fresh.series.cend(); ++it) {
        if (TagMap* series = mSeries.value(it.key(), nullptr))
            series->optimizeAll();
    }
    study.optimizeAll();
}

/// Joins a fresh series with the one of the same UID that the file holds. The series that has volumes stays, the fresh
/// one if both have: its volumes were made from all that is known now. Without volumes the fewer images are copied into
/// the series of the more: a few images that arrive for a series of thousands cost little more than reading and writing
/// the file.
void TagFile::mergeSeries(TagMap* series, const QByteArray& seriesUID, TagMap& freshStudy, TagMap& study)
{
    TagMap* old = mSeries.value(seriesUID, nullptr);
    for (TagMap* image : series->children()) {
        TagMap* former = mImages.take(imageKey(*image));
        if (former != nullptr && former->parent() == old && series->volumes().isEmpty())
            image->takeVolumePlaces(*former);
        delete former;
    }
    if (old != nullptr && series->volumes().isEmpty() &&
        (!old->volumes().isEmpty() || old->children().size() > series->children().size())) {
        copyImages(*series, *old);
        return;
    }
    for (TagMap* image : series->children())
        mImages.insert(imageKey(*image), image);
    if (old != nullptr) {
        copyImages(*old, *series);
        keepVolumeFileMark(*old, *series);
        delete old;
    }
    mSeries.insert(seriesUID, series);
    series->copyFromParent();
    series->deleteElement(kFromDatabase);
    series->detachItems();
    freshStudy.removeChildMap(series);
    attachBelow(study, series, TagMap::SeriesLevel);
}

/// What an image says of the volumes of its old series would name others in the new one. It only comes along into the
/// places of the image that it replaces.
void TagFile::copyImages(const TagMap& from, TagMap& to)
{
    for (TagMap* image : from.children()) {
        TagMap* copy = image->clone();
        copy->deleteElement(kVolumeIndex);
        dropOfTheNode(*copy);
        copy->takeVolumePlaces(*image);
        mImages.insert(imageKey(*copy), copy);
        attachBelow(to, copy, TagMap::ImageLevel);
    }
}

void TagFile::swapIndexes(Indexes& indexes)
{
    mStudies.swap(indexes.studies);
    mSeries.swap(indexes.series);
    std::swap(mImages, indexes.images);
}

bool TagFile::failMerge(const QString& reason)
{
    LogFile::tracef(3, kCategory, "%s", qUtf8Printable(reason));
    return fail(reason);
}

}  // namespace Kdd
