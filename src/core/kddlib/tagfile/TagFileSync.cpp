#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"
#include "platform/base/LogFile.h"
#include "platform/database/Kxg.h"
#include "platform/database/StorageManager.h"

#include <QSet>

#include <condition_variable>
#include <mutex>
#include <thread>

namespace Kdd
{

namespace
{

const char* const kCategory = "kdd";

/// Asks for the images of a study's series while the caller does something else.
class SeriesQuery
{
public:
    explicit SeriesQuery(const QByteArray& studyUID)
        : mThread([this, studyUID] { run(studyUID); })
    {
        // The question is on its way before the caller goes on, not some time after.
        std::unique_lock<std::mutex> lock(mMutex);
        mStarted.wait(lock, [this] { return mIsStarted; });
    }

    ~SeriesQuery()
    {
        if (mThread.joinable())
            mThread.join();
    }

    SeriesQuery(const SeriesQuery&) = delete;
    SeriesQuery& operator=(const SeriesQuery&) = delete;

    Result wait(QMap<QByteArray, std::shared_ptr<Kxg::SeriesInfo>>& series)
    {
        mThread.join();
        series = mSeries;
        return mResult;
    }

private:
    void run(const QByteArray& studyUID)
    {
        {
            const std::lock_guard<std::mutex> lock(mMutex);
            mIsStarted = true;
        }
        mStarted.notify_one();
        mResult = Kxg::GetSeries(studyUID, mSeries);
    }

    std::mutex mMutex;
    std::condition_variable mStarted;
    bool mIsStarted = false;
    QMap<QByteArray, std::shared_ptr<Kxg::SeriesInfo>> mSeries;
    Result mResult;
    std::thread mThread;  // the last member: it starts when the others are there
};

QByteArray forwardSlashes(QByteArray path)
{
    return path.replace('\\', '/');
}

QVector<QByteArray> volumeNames(const TagMap& series)
{
    QVector<QByteArray> names;
    for (const Volume* volume : series.volumes())
        names.append(volume->volumeFileName());
    return names;
}

}  // namespace

bool TagFile::readAndSync(const char* studyUIDGiven, const char* /*user*/)
{
    const QByteArray wanted(studyUIDGiven);  // may be that of the study that is held and let go of now
    const char* studyUID = wanted.constData();
    Result result = Kxg::StorageManager::retrieveStorageVolumes();
    if (result.bad())
        LogFile::warnf("%s", qUtf8Printable(result.text()));
    std::shared_ptr<Kxg::DicomDirectoryEntry> study;
    result = Kxg::GetStudy(studyUID, study);
    if (result.bad()) {
        LogFile::errorf("%s", qUtf8Printable(result.text()));
        return false;
    }
    if (study == nullptr) {
        LogFile::tracef(0, kCategory, "Could not find study %s", studyUID);
        return false;
    }
    SeriesQuery query(studyUID);
    const bool isRead = readWhenFreeForStudy(studyUID, false);
    QMap<QByteArray, std::shared_ptr<Kxg::SeriesInfo>> series;
    result = query.wait(series);
    if (!isRead) {
        LogFile::tracef(3, kCategory, "Could not read tag file for study %s", studyUID);
        return false;
    }
    // Without its images every series would look empty, and all would be removed.
    if (result.bad()) {
        LogFile::errorf("%s", qUtf8Printable(result.text()));
        return false;
    }
    for (Kxg::DicomDirectoryEntry& entry : study->entries)
        entry.seriesInfo = series.value(entry.seriesInstanceUID);
    syncWithDatabase(study);
    return true;
}

bool TagFile::syncWithDatabase(const std::shared_ptr<Kxg::DicomDirectoryEntry>& study)
{
    if (study == nullptr)
        return false;
    if (study->entries.empty()) {
        copyDatabaseValuesIntoTagMap(*study);
        return false;
    }
    bool isChanged = false;
    QSet<QByteArray> listed;
    for (const Kxg::DicomDirectoryEntry& entry : study->entries) {
        listed.insert(entry.seriesInstanceUID);
        if (TagMap* series = findSeries(entry.seriesInstanceUID))
            isChanged = syncSeries(*series, entry) || isChanged;
        else
            LogFile::warnf("Series %s not found in tag map", entry.seriesInstanceUID.constData());
    }
    const QList<QByteArray> held = mSeries.keys();
    std::vector<const char*> gone;
    for (const QByteArray& uid : held) {
        if (!listed.contains(uid))
            gone.push_back(uid.constData());
    }
    isChanged = removeSeries(static_cast<int>(gone.size()), gone.data()) > 0 || isChanged;
    const int series = mSeries.size();
    copyDatabaseValuesIntoTagMap(*study);
    return isChanged || mSeries.size() != series;
}

/// Whether a path, a volume's name or an image changed.
bool TagFile::syncSeries(TagMap& series, const Kxg::DicomDirectoryEntry& entry)
{
    const bool imagesChanged = entry.seriesInfo != nullptr && syncImages(series, *entry.seriesInfo);
    const QVector<QByteArray> names = volumeNames(series);
    addVolumeFilePath(&series, entry, false);
    for (const Kxg::DicomDirectoryEntry& file : entry.entries)
        addVolumeFilePath(&series, file, false);
    return imagesChanged || names != volumeNames(series);
}

bool TagFile::syncImages(TagMap& series, const Kxg::SeriesInfo& info)
{
    bool isChanged = false;
    QSet<const TagMap*> known;
    for (const Kxg::ImageFile& file : info.images) {
        const TagMap* image = findImage(file);
        known.insert(image);
        isChanged = isChanged || (image != nullptr && filePathOf(*image) != forwardSlashes(file.path));
    }
    // A path that an image brought along from the building of the file says nothing of what the database knows.
    for (TagMap* image : series.children()) {
        if (!known.contains(image))
            image->deleteElement(kFilePath);
    }
    bool complete = true;
    const int images = series.children().size();
    if (addDicomFilePaths(&series, &info, false, complete) < images)
        removeImagesWithoutFilename(&series);
    return isChanged || series.children().size() != images;
}

}  // namespace Kdd
