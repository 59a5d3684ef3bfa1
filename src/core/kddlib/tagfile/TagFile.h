#pragma once

#include "kddlib/tagfile/TagFileSettings.h"
#include "platform/base/Export.h"

#include <QByteArray>
#include <QList>
#include <QMap>
#include <QSet>
#include <QString>

#include <memory>
#include <vector>

class DcmDataset;
class QDataStream;

namespace Kxg
{
struct DicomDirectoryEntry;
struct SeriesInfo;
struct TagFileStamp;
}  // namespace Kxg

namespace Kdd
{

class Item;
class TagMap;
struct QAData;
struct QASeriesMove;
struct VolumeInfo;

/// One study's metadata cache: the tree study, series, image of `TagMap`s with indexes by UID, and its file. The one door
/// to all that is done with them; what holds for all tag files of the process is inherited.
///
/// The object owns the study, the study its series, a series its images. The indexes only point into the tree. An
/// image without SOP Instance UID, of which a few kinds of DICOM objects exist, is known by its file path instead.
///
/// One object is used by one thread at a time. Files are shared between processes: whoever changes one holds it
/// exclusively open from before it is read until after it is written, and readers never see it half-written.
/// Every write is first put into a journal beside the file ("<file>.journal"), so that a process that dies in the
/// middle of it leaves nothing torn; whoever opens the file next finishes the write.
class KDD_EXPORT TagFile : public TagFileSettings
{
public:
    TagFile();
    ~TagFile();
    TagFile(const TagFile&) = delete;
    TagFile& operator=(const TagFile&) = delete;

    // ---- the tree

    /// Places an image and takes it over. Null, and the map is deleted, when it belongs to another study than the one
    /// held, when the image is there already and `replace` is false, or when it has neither SOP Instance UID nor path.
    /// `path` may be null; it gives the image's file name suffix. A map that this object holds already stays.
    TagMap* addTagMap(TagMap* map, const char* path, bool replace);

    /// The same for a dataset, which is only read.
    TagMap* addDataset(DcmDataset* dataset, const char* path, bool replace);

    /// The same for a DICOM file. A file that cannot be loaded is logged and gives null.
    TagMap* addDicomFile(const char* file, const char* path, bool replace);

    /// The name under which an image is known: its SOP Instance UID, and where it has none its file path.
    static QByteArray imageKey(const TagMap& image);

    /// Owned by the tree; null when absent.
    TagMap* findSeries(const QByteArray& seriesUID) const;
    TagMap* findImage(const QByteArray& sopUID) const;

    /// Null also when the image has another file name suffix; an empty suffix matches any.
    TagMap* findImage(const QByteArray& sopUID, const QByteArray& suffix) const;

    /// The same image as an `ItemTM` that keeps its study alive, also after the tag file has let go of it; empty when
    /// absent.
    std::shared_ptr<Item> findImageEx(const QByteArray& sopUID, const QByteArray& suffix) const;

    /// Takes the image out and gives a copy of all it showed, which the caller owns; null when absent. The series
    /// stays, even without images.
    TagMap* takeImage(const QByteArray& sopUID);

    /// Remove what is found of `count` UIDs, series and studies that become empty too; the number removed.
    int removeImages(int count, const char** sopUIDs);
    int removeSeries(int count, const char** seriesUIDs);

    /// Removes the images of a series that have no file path (0006,7100) of their own.
    void removeImagesWithoutFilename(TagMap* series);

    void deleteEmptyNodes();

    /// Places every attribute where it costs the fewest bytes.
    void optimizeAll();

    /// Takes over the study of another object, in place of the one held; that one is empty then. Files held open stay with
    /// whom they are.
    void takeTree(TagFile& other);

    void clear();
    bool isEmpty() const;

    /// Of the study held; empty when there is none.
    QByteArray studyInstanceUID() const;
    std::shared_ptr<TagMap> study() const;

    const QMap<QByteArray, TagMap*>& seriesByUID() const;
    const QMap<QByteArray, TagMap*>& imagesByUID() const;

    /// The names by which `imagesByUID` knows the images that were added to this object, in the order in which they were; also of
    /// those that have been replaced or removed since. Empty after reading a file.
    const QVector<QByteArray>& addedImages() const;

    /// Counts of the present tree, and times [ms] and sizes [bytes] of its last optimisation, reading and writing.
    struct Statistics
    {
        int series = 0;
        int images = 0;
        int volumes = 0;
        int blobs = 0;
        int optimiseMs = 0;
        int readMs = 0;
        int writeMs = 0;
        int storedSize = 0;
        int uncompressedSize = 0;
        int unoptimisedSize = 0;  ///< before optimisation, uncompressed; only with `kMeasureUnoptimised`
        int blobBytes = 0;
        int missingBlobs = 0;  ///< of those that the file read last promised, cut off at its end
    };

    Statistics statistics() const;

    /// The same, one by one.
    // NOLINTNEXTLINE(readability-function-size): the system's other parts call it in this form
    void getStatistics(int& series, int& images, int& volumes, int& blobs, int& optimiseMs, int& readMs,
                       int& writeMs, int& storedSize, int& uncompressedSize, int& unoptimisedSize,
                       int& blobBytes) const;

    // ---- the file

    /// Where the file of the study held lies.
    QString cacheFilePath() const;

    /// Reads the file at `path`; with `studyUID` not null only that study. With `keepOpen` the file is opened
    /// exclusively and stays so until `writeCacheFile()` or `close()`. While others hold the file, it is tried for 0.4
    /// seconds, as by corrections; a merge and a write try for 2 seconds.
    bool readCacheFile(const QString& path, const char* studyUID, bool keepOpen);
    bool readCacheFileForStudy(const char* studyUID, bool keepOpen);

    /// The same for whoever serves others, who would rather wait than say that there is nothing: while others hold the
    /// file, it is tried for as long as the site's settings say (`ExResource::readPatience`). That it stayed held is not
    /// logged, for the caller knows what it means.
    bool readWhenFree(const QString& path, const char* studyUID, bool keepOpen);
    bool readWhenFreeForStudy(const char* studyUID, bool keepOpen);

    /// The same with the digest of the very bytes that were read: `stamp()` then tells which state of the file the study
    /// shows, as it does after a write. The file is not kept open.
    bool readStampedWhenFree(const QString& path, const char* studyUID);

    /// Reads from a stream. The object is empty when false is returned.
    bool readCacheFile(QDataStream& in, const char* studyUID);

    /// Writes to the file held open, else to the study's own place. An empty object deletes the file held open.
    /// False when not everything could be written; the file then keeps what it held.
    bool writeCacheFile();
    bool writeCacheFile(const char* path);

    /// Writes to a stream. False, with nothing written, when the study holds what its reader would refuse or lose, among
    /// that images of so many volumes that the format cannot tell them apart. A volume that lost all its images goes
    /// before any write.
    bool writeCacheFile(QDataStream& out);

    /// Brings the images held here into the study's file, in place of images with the same UID, while the file is
    /// held exclusively open. The object then holds the whole study. On failure before the write the object keeps its
    /// images; on failure of the write it holds the whole study, so that nothing is lost and the call can be repeated.
    bool mergeIntoCacheFile();

    // ---- volumes

    /// Adds the volumes of one series, whose indexes are their places in `infos`. Images that are not held, or belong
    /// to another series than the volume's first one, are warned about and passed over; a volume none of whose images
    /// is held is not made.
    void addVolumeInfo(const std::vector<VolumeInfo*>& infos);

    /// Called when a study's volumes are complete; there is nothing left to do then.
    void createVolumes();

    /// Adds what is left of a volume whose images a correction has divided, named in `info` as they are known here: to
    /// each series that holds some of them a bare volume of these. Those that are not held stand elsewhere.
    void addDividedVolume(const VolumeInfo& info);

    /// Gives the images held here the volumes that another state of the same study has of volume files with these
    /// suffixes, and what was divided of them. `former` has none any more then.
    void keepVolumesOf(TagFile& former, const QSet<QByteArray>& suffixes);

    // ---- previews

    /// The images that get a preview of their own, by SOP Instance UID: those that no volume shows, all of a short
    /// series, a representative one of a long series and of each special kind (ultrasound, captures, localizers).
    void selectPreviewImages2D(QList<QByteArray>& uids) const;

    /// Make and keep the preview of an image, and of a mammogram where the breast lies. False when the image is not
    /// held, cannot be loaded or cannot be shown, which is logged with `path`.
    bool addPreview(TagMap* image, DcmDataset* dataset, const QString& path);
    bool addPreview(TagMap* image, const QByteArray& file);
    bool addPreview(const QByteArray& sopInstanceUID, const QString& path);
    bool addPreview(DcmDataset* dataset, const QString& path);

    /// Writes every preview to a folder as "HASH_Series_N_Image_N.jpg" and "HASH_Series_N_Volume_N.jpg". A file that
    /// cannot be written is warned about and passed over. How many were written.
    int exportPreviews(const QString& folder) const;

    // ---- corrections

    /// Applies a correction to the tag files of its study and, for a move, of its old study, which are held exclusively
    /// from before they are read until after they are written. Values are replaced image by image; what was changed
    /// goes to each image's `AuditLog`. An image whose study, series or own UID is changed goes to where it then
    /// belongs, with its preview and its part of the volumes. Images that are not found are counted only, and a job
    /// all of whose values are there already changes nothing.
    ///
    /// When an image database is set and knows one of the studies, these are claimed, and the correction is recorded
    /// there before the files are written, so that every later build makes it again.
    ///
    /// False, with the reason in `message`, when a study could not be claimed, a file could not be held, read or written,
    /// the database could not be reached, or when a value cannot be replaced without losing something; `fault` in the
    /// outcome tells which. Then both files are as they were, unless the fault is `Kept`: what was to be written is in a
    /// file's journal or in the database and will be shown. Of a move that no database knows of images may stand in both
    /// studies, which the message tells; as after the death of the process in the middle, running the job again completes
    /// it. A job whose old study is its study becomes an edit.
    static bool applyQA(QAData& job, QString& message);

    /// Tells in the job's outcome what `applyQA` would do now, and why it would refuse, by doing all of it but for keeping
    /// it: no file, claim or record is touched.
    static bool previewQA(QAData& job, QString& message);

    /// Gives back the volumes that were taken out of a series before its images changed: each part of a volume to the
    /// series that now holds its images. A volume that stays whole keeps all it says; one that is divided has only its
    /// images and slices in common with the volume file, so its parts are bare.
    void updateVolumesAfterQA(QASeriesMove& move);

    // ---- the image database

    /// Gives every image that `info` names its file path. Images not held are warned about, and `complete` becomes
    /// false, or are made with `createMissing`. How many images received a path.
    int addDicomFilePaths(TagMap* series, const Kxg::SeriesInfo* info, bool createMissing, bool& complete);

    /// Gives the volume that a volume file's name stands for that name: the one of its suffix, else of its part number.
    /// `createMissing` makes a volume that is not there. Other entries change nothing.
    static void addVolumeFilePath(TagMap* series, const Kxg::DicomDirectoryEntry& entry, bool createMissing);

    /// Marks the study as known to the database, and adds an empty series for each one that only the database has but
    /// for reports, presentation states and segmentations. What the tree knows already stays as it is.
    void copyDatabaseValuesIntoTagMap(const Kxg::DicomDirectoryEntry& entry);

    /// Gives every series a label (0006,7120) that no other series of the study has.
    void createAbstractTags();

    /// Reads the study's tag file and brings it into line with the image database, in memory only. `user` is for
    /// databases that ask who asks; ours does not. False when the database does not know the study or the file cannot
    /// be read; a file that others hold is waited for as by `readWhenFree`.
    bool readAndSync(const char* studyUID, const char* user);

    /// Brings the tree into line with what the database says of the study: file paths, volume names, series that are
    /// gone. An image that a correction moved here or renamed stays. Another study's entry is refused. Whether anything
    /// changed.
    bool syncWithDatabase(const std::shared_ptr<Kxg::DicomDirectoryEntry>& study);

    /// Of the file that this object wrote last, or read with `readStampedWhenFree`; empty before, and when that failed.
    const Kxg::TagFileStamp& stamp() const;

    /// Why the last read, write or merge failed, in words; empty after success.
    const QString& failure() const;

    /// Whether it failed because others held the file all the time, or were just making it, so that trying again makes
    /// sense and nothing is known of the study.
    bool wasLockedOut() const;

    /// Closes the file held open; false if there is none.
    bool close();

private:
    struct Private;

    std::unique_ptr<Private> d;
};

}  // namespace Kdd
