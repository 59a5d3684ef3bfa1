#pragma once

#include "platform/base/Export.h"
#include "platform/base/Result.h"
#include "platform/base/Stopwatch.h"

#include <QByteArray>
#include <QList>

#include <memory>
#include <string>
#include <vector>

namespace Kdd
{

class ImagesAhead;
class OrlanMesh;
class TagFile;
class TagMap;
struct LoadedHeader;
struct StudySources;
struct VolumeInfo;

/// Builds the complete tag file of a study: images, volumes and previews, from the files that the image database lists
/// for it (`Kxg::SetDatabaseServer`).
///
/// Corrections that the database knows are made again, so that an image shows what it showed before. Those that only the
/// study's present tag file tells of are handed to the database first.
///
/// A file that cannot be read is logged. What the present tag file has of it is kept; where that has nothing, it is left
/// out. But for that what comes out depends on the files, their paths and the corrections only, not on the database's
/// engine or on the order in which they were registered.
///
/// One generator builds one study at a time; several may work on several threads.
class KDD_EXPORT TagFileGenerator
{
public:
    /// As user "zp_administrator", optimising.
    TagFileGenerator();

    /// `user` is in whose name the database is asked; null stands for "zp_administrator". `optimize` places every
    /// attribute where it costs the fewest bytes before the file is written.
    TagFileGenerator(const char* user, bool optimize);

    void setOptions(const char* user, bool optimize);

    /// Files read at once; 0, as at first: as many as there are cores to spare. What is built does not depend on it.
    void setReaders(int readers) { mReaders = readers; }

    /// Builds the study of that number into `tagFile`, in place of what it holds, and writes its cache file. With
    /// `studyInstanceUID` not null, files before the first image that belong to another study are warned about and
    /// left out. False when the database cannot be asked or the file cannot be written; `tagFile` then keeps what was
    /// built.
    bool createTagFile(TagFile& tagFile, int studyId, const char* studyInstanceUID);

    /// The same, but files whose images `loaded` holds, by their paths in (0006,7100), are not loaded again. Where it is the
    /// study already, as it would be built, it is taken over and empty afterwards.
    bool createTagFile(TagFile& tagFile, int studyId, const char* studyInstanceUID, TagFile& loaded);

    /// The same on a tag file of its own.
    bool createTagFile(int studyId);

    /// Prepares images that have just arrived (with their file paths in (0006,7100)) for being merged into the study's
    /// cache file: makes the previews that the study will want once they are part of it, labels and optimises.
    void completeArrivals(TagFile& arrivals);

    /// The same with the present cache file at hand; empty: there is none. Afterwards `present` shows the arrivals too.
    void completeArrivals(TagFile& arrivals, TagFile& present);

    /// Adds an image that was made of the file at `path` to a study's tree, as builds do: it takes the place of one of
    /// the same SOP Instance UID, and names its file. Null, and it is destroyed, when it is of another study; else the
    /// tree owns it.
    static TagMap* place(TagFile& tagFile, std::unique_ptr<TagMap> image, const QByteArray& path);

    /// Removes the tag file of a study that has no images any more, waiting some minutes for whoever holds it. Success
    /// when there is none.
    static Result removeTagFile(const QByteArray& studyInstanceUID);

    /// Of the images of the last build whose files could not be read: those that are as the earlier tag file had them,
    /// and those that are missing.
    int numKept() const { return mNumKept; }
    int numMissing() const { return mNumMissing; }

    /// What loading DICOM files, reading volume files and making previews took in the last build [ms].
    void getTimings(int& loadMs, int& volumeMs, int& previewMs) const;

protected:
    /// Adds the volumes of the files to their series, in the order of the files.
    void addVolumeInfo(TagFile& tagFile, const std::vector<std::string>& volumeFiles);

    /// What a volume file says, and the series it belongs to; null when it cannot be used, which is logged. The caller
    /// owns it.
    VolumeInfo* createVolumeInfo(const char* path, QByteArray& seriesInstanceUID);

private:
    void addFiles(TagFile& tagFile, const char* studyInstanceUID, StudySources& sources);
    void addFile(TagFile& tagFile, const std::string& path, const char* studyInstanceUID,
                 StudySources& sources, ImagesAhead& ahead);
    std::unique_ptr<TagMap> readListed(const std::string& path, const char* studyInstanceUID,
                                       StudySources& sources, ImagesAhead& ahead);
    std::unique_ptr<TagMap> load(const std::string& path, StudySources& sources, ImagesAhead& ahead);
    void addVolumes(TagFile& tagFile, const std::vector<std::string>& volumeFiles, StudySources& sources);
    static bool write(TagFile& tagFile, StudySources& sources);
    static bool addImage(TagFile& tagFile, std::unique_ptr<TagMap> image, const std::string& path,
                         const char* studyInstanceUID);
    void addPreviews(TagFile& tagFile, const QList<QByteArray>& chosen, const StudySources& sources);
    static void addPreview(TagFile& tagFile, TagMap& image, const QByteArray& url,
                           const LoadedHeader& loaded);
    void addPreview(OrlanMesh& mesh, const char* path, VolumeInfo& info);
    void finishTree(TagFile& tagFile) const;

    QByteArray mUser;
    bool mOptimize = true;
    int mReaders = 0;
    int mNumKept = 0;
    int mNumMissing = 0;
    StopwatchSum mLoadWatch;
    StopwatchSum mVolumeWatch;
    StopwatchSum mPreviewWatch;
};

}  // namespace Kdd
