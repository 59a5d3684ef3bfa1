#pragma once

#include "platform/base/Export.h"

#include <QByteArray>
#include <QMap>

#include <memory>
#include <set>

namespace Kdd
{

class Item;
class TagFile;
class Volume;

/// Serves metadata, datasets and volumes by file path, from tag files where they know the answer and from the DICOM
/// files where they do not.
///
/// Served files are named <study directory>/<SOP Instance UID>_<suffix>.dcm, the directory by the Study Instance UID.
/// The tag file of a study is read when the study is first asked for, and kept until `clear`; that there is none is
/// remembered as well. One that others hold for longer than the site's patience (`TagFile::readWhenFree`) is neither
/// there nor absent: its study is answered from the DICOM files, and it is read at the next request.
///
/// Items handed out keep what they need, whatever becomes of the loader. They see changes of a tag file that was added.
///
/// Copies share the tag files. Used by one thread at a time. Nothing throws: what fails is logged, and the answer is
/// empty.
class KDD_EXPORT Loader
{
public:
    Loader();
    Loader(const Loader& other);
    Loader& operator=(const Loader& other);
    virtual ~Loader();

    /// Has the study answered by this tag file, in place of the one kept.
    void addTagFile(const QByteArray& studyUID, const std::shared_ptr<TagFile>& file);

    /// Reads the study's tag file anew; when there is none any more, that is remembered. False when it cannot be read,
    /// because others hold it or it is damaged; then the one kept goes on answering.
    bool refresh(const QByteArray& studyUID);

    /// Forgets all tag files.
    void clear();

    /// The attributes of the image at a path: from the tag file if the study has one that holds the image, else of the
    /// loaded file.
    std::shared_ptr<Item> loadMetaData(const char* path);
    std::shared_ptr<Item> loadMetaData(const char* path, const QByteArray& sopUID,
                                       const QByteArray& studyUID);

    /// The dataset of a file; of its first `size` bytes if that is not -1, which must end between two attributes.
    static std::shared_ptr<Item> loadDcmDataset(const char* path, int size);

    /// What the tag file says of a volume file: of the series' first volume, or of the n-th if "_part" and n stand in
    /// the name. Null when it says nothing of that file. Owned by the study's tree, which this loader keeps alive until
    /// `clear`, until it is assigned to or until its end, also when the study's tag file is replaced meanwhile. So who
    /// refreshes studies for months calls `clear` now and then.
    Volume* loadVolume(const char* path, const QByteArray& seriesUID, const QByteArray& studyUID);

    /// The UIDs that the path of a served file names. "/" and "\\" both separate its parts. False, and both empty, when it
    /// does not end in ".dcm" or names no folder.
    static bool extractUIDs(const char* path, QByteArray& sopUID, QByteArray& studyUID);

    /// What tells several files of one instance apart: what stands between the last "_" of the file name and ".dcm"; the
    /// whole stem when there is no "_", and empty when the path does not end in ".dcm".
    static QByteArray extractSuffix(const char* path);

protected:
    TagFile& tagFileForStudy(const QByteArray& studyUID);

private:
    QMap<QByteArray, std::shared_ptr<TagFile>> mTagFiles;
    std::set<std::shared_ptr<const void>> mLent;  // the owners of volumes handed out

    // What the path of a request names. Kept for the memory only, which the next request uses again.
    QByteArray mSopUID;
    QByteArray mStudyUID;
    QByteArray mSuffix;
};

}  // namespace Kdd
