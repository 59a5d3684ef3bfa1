#include "kddlib/tagfile/DatabaseSync.h"

#include "kddlib/tagfile/DatabaseValues.h"
#include "kddlib/tagfile/StoredStudy.h"
#include "kddlib/tagfile/qa/QAAudit.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"
#include "platform/base/LogFile.h"
#include "platform/database/Kxg.h"
#include "platform/database/StorageManager.h"

#include <QHash>
#include <QSet>

#include <dcmtk/dcmdata/dcdeftag.h>

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
        // The question writes into this object, so nobody may leave before its answer.
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

QVector<QByteArray> volumeNames(const TagMap& series)
{
    QVector<QByteArray> names;
    for (const Volume* volume : series.volumes())
        names.append(volume->volumeFileName());
    return names;
}

const std::vector<Kxg::ImageFile> kNoImages;

/// What the database lists of a study, in terms of the tree that is held. Corrections are no part of the database: an
/// image that they gave another UID, series or study is listed as what it was before.
class DatabaseView
{
public:
    DatabaseView(const StudyTree& tree, const Kxg::DicomDirectoryEntry& study)
    {
        // By the log, since the database may list an image under the UID that it had before it was corrected.
        const QHash<QByteArray, const TagMap*> renamed = correctedImages(tree);
        for (const Kxg::DicomDirectoryEntry& entry : study.entries) {
            mListed.insert(entry.seriesInstanceUID);
            if (entry.seriesInfo == nullptr)
                continue;
            mAsked.insert(entry.seriesInstanceUID);
            for (const Kxg::ImageFile& image : entry.seriesInfo->images) {
                mKnown.insert(DatabaseValues::findImage(tree, image));
                mKnown.insert(renamed.value(image.sopInstanceUID, nullptr));
            }
        }
    }

    bool lists(const QByteArray& seriesUID) const { return mListed.contains(seriesUID); }
    bool listsImagesOf(const QByteArray& seriesUID) const { return mAsked.contains(seriesUID); }
    bool knows(const TagMap* image) const { return mKnown.contains(image); }

private:
    /// By the UIDs that they had before. Those of another study are not listed here at all.
    QHash<QByteArray, const TagMap*> correctedImages(const StudyTree& tree)
    {
        QHash<QByteArray, const TagMap*> renamed;
        for (const TagMap* image : tree.images()) {
            AuditLog log;
            QVector<AuditEntry> entries;
            if (!log.read(*image) || log.text().isEmpty() || !log.decode(entries))
                continue;
            QString formerUID;
            for (const AuditEntry& entry : qAsConst(entries)) {
                for (const AuditChange& change : entry.changes) {
                    // Moved here from another study: that it is not listed here says nothing.
                    if (change.key == DCM_StudyInstanceUID)
                        mKnown.insert(image);
                    // The first change tells what the DICOM file says;
                    // later ones replaced what corrections had made.
                    if (change.key == DCM_SOPInstanceUID && formerUID.isEmpty())
                        formerUID = change.oldText;
                }
            }
            if (!formerUID.isEmpty())
                renamed.insert(formerUID.toLatin1(), image);
        }
        return renamed;
    }

    QSet<QByteArray> mListed;
    QSet<QByteArray> mAsked;
    QSet<const TagMap*> mKnown;
};

/// Whether the path of an image changed. The series need not be held: the newest file of an image that stands in another
/// one may say that it belongs there. Until that file is taken the image keeps its place, and follows the file.
bool followFiles(const StudyTree& tree, const Kxg::DicomDirectoryEntry& entry)
{
    bool isChanged = false;
    for (const Kxg::ImageFile& file : entry.seriesInfo != nullptr ? entry.seriesInfo->images : kNoImages) {
        TagMap* image = DatabaseValues::findImage(tree, file);
        if (image == nullptr || filePathOf(*image) == forwardSlashes(file.path))
            continue;
        DatabaseValues::setFilePath(*image, file);
        isChanged = true;
    }
    return isChanged;
}

/// Whether a path or a volume's name changed.
bool syncSeries(StudyTree& tree, TagMap& series, const Kxg::DicomDirectoryEntry& entry)
{
    const bool isChanged = followFiles(tree, entry);
    // The images have their paths; what is listed and not held is warned about.
    bool complete = true;
    DatabaseValues(tree).addFilePaths(&series, entry.seriesInfo.get(), false, complete);
    const QVector<QByteArray> names = volumeNames(series);
    DatabaseValues::addVolumeFilePath(&series, entry, false);
    for (const Kxg::DicomDirectoryEntry& file : entry.entries)
        DatabaseValues::addVolumeFilePath(&series, file, false);
    return isChanged || names != volumeNames(series);
}

/// Removes the images and series that the database does not list. The path that an image brought along from the building
/// of the file says nothing of what the database knows.
bool removeUnlisted(StudyTree& tree, const DatabaseView& view)
{
    bool isChanged = false;
    // A copy, because series go from the index meanwhile.
    const StudyTree::Nodes held = tree.series();
    for (auto it = held.cbegin(); it != held.cend(); ++it) {
        TagMap* series = it.value();
        const QList<TagMap*> images = series->children();
        // Of a listed series whose images were not asked for nothing is known.
        const bool isAsked = !view.lists(it.key()) || view.listsImagesOf(it.key());
        // From the end, where an image leaves its series at no cost.
        for (int i = images.size() - 1; i >= 0 && isAsked; --i) {
            if (view.knows(images.at(i)))
                continue;
            tree.dropImage(images.at(i));
            isChanged = true;
        }
        // A series that is listed stays, even without images: the database says that it is there.
        if (view.lists(it.key()) || !series->children().isEmpty())
            continue;
        tree.dropSeriesAndEmptyStudy(series);
        isChanged = true;
    }
    return isChanged;
}

}  // namespace

bool readAndSync(StoredStudy& held, const QByteArray& wanted, Result& read)
{
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
    // The database answers while the file is read: both take about as long.
    SeriesQuery query(studyUID);
    read = held.read(TagFileSettings::cacheFilePathForStudy(studyUID), studyUID, false,
                     StoredStudy::Reader::Serving);
    QMap<QByteArray, std::shared_ptr<Kxg::SeriesInfo>> series;
    result = query.wait(series);
    if (read.bad()) {
        LogFile::tracef(3, kCategory, "Could not read tag file for study %s", studyUID);
        return false;
    }
    // Without its images every series would look empty, and all would be removed.
    if (result.bad()) {
        LogFile::errorf("%s", qUtf8Printable(result.text()));
        return false;
    }
    // A series of volume files alone is one whose images are gone, not one whose images were not asked for.
    for (Kxg::DicomDirectoryEntry& entry : study->entries)
        entry.seriesInfo = series.value(entry.seriesInstanceUID, std::make_shared<Kxg::SeriesInfo>());
    syncWithDatabase(held.tree(), study);
    return true;
}

bool syncWithDatabase(StudyTree& tree, const std::shared_ptr<Kxg::DicomDirectoryEntry>& study)
{
    if (study == nullptr)
        return false;
    if (!tree.isEmpty() && tree.studyInstanceUID() != study->studyInstanceUID) {
        LogFile::errorf("Study %s is not synchronised with what the database says of study %s",
                        tree.studyInstanceUID().constData(), study->studyInstanceUID.constData());
        return false;
    }
    // An entry without series says nothing of them; it must not empty the study.
    if (study->entries.empty()) {
        DatabaseValues(tree).copyStudy(*study);
        return false;
    }
    // Before anything changes: an image without UID is found by the path that it has now.
    const DatabaseView view(tree, *study);
    bool isChanged = false;
    for (const Kxg::DicomDirectoryEntry& entry : study->entries) {
        if (TagMap* series = tree.findSeries(entry.seriesInstanceUID)) {
            isChanged = syncSeries(tree, *series, entry) || isChanged;
        } else {
            LogFile::warnf("Series %s not found in tag map", entry.seriesInstanceUID.constData());
            isChanged = followFiles(tree, entry) || isChanged;
        }
    }
    isChanged = removeUnlisted(tree, view) || isChanged;
    // Series that only the database has are added below, which counts as a change too.
    const int series = tree.series().size();
    DatabaseValues(tree).copyStudy(*study);
    return isChanged || tree.series().size() != series;
}

}  // namespace Kdd
