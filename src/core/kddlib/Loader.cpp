#include "kddlib/Loader.h"

#include "kddlib/items/FileNaming.h"
#include "kddlib/items/kdditemof.h"
#include "kddlib/items/kdditemtm.h"
#include "kddlib/net/KxCurlClient.h"
#include "kddlib/net/dicom/DicomFileReader.h"
#include "kddlib/net/dicom/KxDcmFileLoader.h"
#include "kddlib/net/http/KxCurlDownloadStream.h"
#include "kddlib/net/http/ObjectAddress.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"
#include "kddlib/volumes/VolumeLookup.h"
#include "platform/base/LogFile.h"
#include "platform/base/Stopwatch.h"
#include "platform/os/RandomAccessFile.h"
#include "platform/volumefile/VolumeFileName.h"

#include <QFile>

#include <dcmtk/dcmdata/dcfilefo.h>

#include <algorithm>
#include <new>

namespace Kdd
{

namespace
{

/// The dataset is taken out of the file object, which goes; the item keeps it alive.
std::shared_ptr<Item> itemOf(DcmFileFormat& file)
{
    return std::make_shared<ItemOF>(std::shared_ptr<DcmDataset>(file.getAndRemoveDataset()));
}

std::shared_ptr<Item> loadWholeFile(const char* path)
{
    DcmFileFormat file;
    const OFCondition condition = loadDicomFile(path, file);
    if (condition.good())
        return itemOf(file);
    LogFile::errorf("Could not load %s: %s", shownAddress(path).constData(), condition.text());
    return nullptr;
}

/// How many of the first bytes of an object there are; -1 when it cannot be had. No range is asked for, because not
/// every server knows them; what is on its way beyond is broken off.
qint64 readFirstOfObject(const char* url, QByteArray& bytes, std::string& reason)
try {
    KxCurlDownloadStream stream = KxCurlClient::instance().read(url, false);
    const KxHttpStatus& status = stream.httpStatus();
    reason = status.reason();
    return status.code / 100 == 2 ? stream.read(bytes.data(), bytes.size()).gcount() : -1;
} catch (const std::exception& fault) {
    reason = fault.what();
    return -1;
}

qint64 readFirst(const char* path, QByteArray& bytes, std::string& reason)
{
    if (KxCurlClient::isUrl(path))
        return readFirstOfObject(path, bytes, reason);
    RandomAccessFile file;
    return file.open(path).good() ? qMax<qint64>(0, file.readAt(0, bytes.data(), bytes.size())) : -1;
}

/// The first bytes of a file; false, with the reason logged, when there are not so many.
bool readBeginning(const char* path, int size, QByteArray& bytes)
{
    try {
        bytes.resize(size);
    } catch (const std::bad_alloc&) {
        LogFile::errorf("%s: Could not allocate %lld bytes.", path, static_cast<long long>(size));
        return false;
    }
    std::string reason;
    const qint64 count = readFirst(path, bytes, reason);
    if (count < 0)
        LogFile::errorf("Could not open %s%s%s", shownAddress(path).constData(), reason.empty() ? "" : ": ",
                        reason.c_str());
    else if (count != size)
        LogFile::errorf("%s: Could only read %d of %d bytes", path, static_cast<int>(count), size);
    return count == size;
}

std::shared_ptr<Item> loadBeginning(const char* path, int size)
{
    QByteArray bytes;
    if (!readBeginning(path, qMax(0, size), bytes))
        return nullptr;
    DcmFileFormat file;
    const OFCondition condition = readDicomBuffer(bytes, file);
    if (condition.good())
        return itemOf(file);
    LogFile::errorf("Could not load %s from buffer stream: %s", path, condition.text());
    return nullptr;
}

QByteArray baseName(const QByteArray& path)
{
    return path.mid(qMax(path.lastIndexOf('/'), path.lastIndexOf('\\')) + 1);
}

/// Waits as long as the site allows, for whoever asks a loader would
/// rather wait than hear that there is nothing.
bool readTagFile(TagFile& file, const QByteArray& studyUID)
{
    const Stopwatch stopwatch;
    if (!file.readWhenFreeForStudy(studyUID.constData(), false))
        return false;
    const QString path = TagFile::cacheFilePathForStudy(studyUID.constData());
    LogFile::printf("Tag file %s read in %d msec", qUtf8Printable(path), stopwatch.elapsed());
    return true;
}

bool hasFilePath(const TagMap& image, const char* path)
{
    // Only the image's own path counts; one that it inherits may be shared with others.
    const TagElement* held = image.tagsForLevel().value(kFilePath, nullptr);
    const uint length = qstrlen(path);
    return held != nullptr && held->vr() == VrCode::LO && static_cast<uint>(held->value().size()) == length &&
           std::equal(path, path + length, held->value().constData());
}

}  // namespace

Loader::Loader() = default;
Loader::Loader(const Loader& other) = default;
Loader& Loader::operator=(const Loader& other) = default;
Loader::~Loader() = default;

void Loader::addTagFile(const QByteArray& studyUID, const std::shared_ptr<TagFile>& file)
{
    mTagFiles.insert(studyUID, file);
}

void Loader::clear()
{
    mTagFiles.clear();
    mLent.clear();
}

bool Loader::refresh(const QByteArray& studyUID)
{
    const auto file = std::make_shared<TagFile>();
    const bool isRead = readTagFile(*file, studyUID);
    // That a file is there and cannot be read is no reason to forget what was known.
    if (!isRead &&
        (file->wasLockedOut() || QFile::exists(TagFile::cacheFilePathForStudy(studyUID.constData()))))
        return false;
    addTagFile(studyUID, file);
    return true;
}

/// A study without tag file gets an empty one, so that the file is not looked for at every request. An empty one that
/// others held when it was to be read says nothing yet.
TagFile& Loader::tagFileForStudy(const QByteArray& studyUID)
{
    std::shared_ptr<TagFile>& file = mTagFiles[studyUID];
    if (file != nullptr && !(file->wasLockedOut() && file->isEmpty()))
        return *file;
    // Always a new one: others may have the one that is there.
    file = std::make_shared<TagFile>();
    if (readTagFile(*file, studyUID))
        return *file;
    if (file->wasLockedOut())
        LogFile::warnf("The tag file of study %s is held by others, its DICOM files answer",
                       studyUID.constData());
    else
        LogFile::warnf("No tag file found for study %s", studyUID.constData());
    return *file;
}

std::shared_ptr<Item> Loader::loadMetaData(const char* path)
{
    return extractUIDs(path, mSopUID, mStudyUID) ? loadMetaData(path, mSopUID, mStudyUID)
                                                 : loadDcmDataset(path, -1);
}

std::shared_ptr<Item> Loader::loadMetaData(const char* path, const QByteArray& sopUID,
                                           const QByteArray& studyUID)
{
    Kdd::extractSuffix(path, mSuffix);
    std::shared_ptr<Item> item =
        studyUID.isEmpty() ? nullptr : tagFileForStudy(studyUID).findImageEx(sopUID, mSuffix);
    if (item == nullptr)
        return loadDcmDataset(path, -1);
    // Under this path the file is known to whoever asks, wherever it lay when the tag file was built. Nearly always it
    // is the one it was asked for by before, and looking costs less than storing it anew.
    TagMap& image = static_cast<ItemTM&>(*item).tagMap();
    if (!hasFilePath(image, path))
        image.putAndInsertValue(kFilePath, VrCode::LO, path);
    return item;
}

std::shared_ptr<Item> Loader::loadDcmDataset(const char* path, int size)
{
    return size == -1 ? loadWholeFile(path) : loadBeginning(path, size);
}

Volume* Loader::loadVolume(const char* path, const QByteArray& seriesUID, const QByteArray& studyUID)
{
    if (studyUID.isEmpty())
        return nullptr;
    const TagFile& file = tagFileForStudy(studyUID);
    const TagMap* series = file.findSeries(seriesUID);
    if (series == nullptr)
        return nullptr;
    const QByteArray name = baseName(path);
    const int part = partNumberOf(name);
    // The first volume's file has no part in its name, the second one's is part 2.
    const int index = part < 0 ? 0 : part - 1;
    const QByteArray suffix = Volume::fileNameSuffix(name.constData());
    Volume* volume = index >= 0 ? volumeOfSuffix(*series, suffix, index) : nullptr;
    // One that only bears the file's name does not answer: without a suffix
    // the tag file keeps none of a volume's values.
    if (volume != nullptr && volume->fileNameSuffix() == suffix) {
        // The tree as well as the tag file, which may be given another tree by whoever added it.
        mLent.insert(file.study());
        mLent.insert(mTagFiles.value(studyUID));
        return volume;
    }
    // Volumes are numbered without those whose files could not be read; only the suffix tells them apart for sure.
    volume = volumeOfIndex(*series, index);
    if (index < 0 || volume == nullptr) {
        LogFile::warnf("Illegal volume index. Cannot load volume from tag file.");
        return nullptr;
    }
    if (volume->fileNameSuffix().isEmpty()) {
        LogFile::printf("No filename suffix. Cannot load volume from tag file.");
        return nullptr;
    }
    LogFile::warnf("Filename suffix does not match. Cannot load volume from tag file.");
    return nullptr;
}

bool Loader::extractUIDs(const char* path, QByteArray& sopUID, QByteArray& studyUID)
{
    return Kdd::extractUIDs(path, sopUID, studyUID);
}

QByteArray Loader::extractSuffix(const char* path)
{
    return Kdd::extractSuffix(path);
}

}  // namespace Kdd
