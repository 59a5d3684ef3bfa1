#pragma once

#include "platform/base/Export.h"

#include <QByteArray>
#include <QMap>

#include <memory>

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
/// remembered as well.
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

    /// Forgets all tag files. Items handed out keep what they need.
    void clear();

    /// The attributes of the image at a path: from the tag file if the study has one that holds the image, else of the
    /// loaded file.
    std::shared_ptr<Item> loadMetaData(const char* path);
    std::shared_ptr<Item> loadMetaData(const char* path, const QByteArray& sopUID,
                                       const QByteArray& studyUID);

    /// The dataset of a file; of its first `size` bytes if that is not -1, which must end between two attributes.
    static std::shared_ptr<Item> loadDcmDataset(const char* path, int size);

    /// What the tag file says of a volume file: of the series' first volume, or of the n-th if "_part" and n stand in
    /// the name. Null when it says nothing of that file. Owned by the tag file, and valid until `clear`.
    Volume* loadVolume(const char* path, const QByteArray& seriesUID, const QByteArray& studyUID);

    /// See items/FileNaming.h.
    static bool extractUIDs(const char* path, QByteArray& sopUID, QByteArray& studyUID);
    static QByteArray extractSuffix(const char* path);

protected:
    TagFile& tagFileForStudy(const QByteArray& studyUID);

private:
    QMap<QByteArray, std::shared_ptr<TagFile>> mTagFiles;

    // What the path of a request names. Kept for the memory only, which the next request uses again.
    QByteArray mSopUID;
    QByteArray mStudyUID;
    QByteArray mSuffix;
};

}  // namespace Kdd
