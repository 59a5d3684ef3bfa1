#pragma once

#include "kddlib/Limits.h"
#include "kddlib/items/PlainFiles.h"
#include "kddlib/items/PlainObjects.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagfile/qa/AdoptedCorrections.h"
#include "kddlib/tagfile/qa/BuildCorrections.h"
#include "platform/base/Result.h"

#include <QHash>
#include <QSet>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdatset.h>

#include <map>
#include <memory>
#include <string>
#include <vector>

namespace Kdd
{

/// The datasets of a study as they were loaded, for the previews that are chosen once all are known. A dataset costs a
/// hundred times what its tag map costs, so of large studies only the first are kept; the others are loaded again when
/// they are chosen.
class KeptDatasets
{
public:
    void keep(const QByteArray& path, std::unique_ptr<DcmDataset> dataset);

    /// Null when it is not kept.
    DcmDataset* find(const QByteArray& path) const;

private:
    std::map<QByteArray, std::unique_ptr<DcmDataset>> mDatasets;  // by path
};

/// Images of a tag file, which must outlive the object, by the paths of their files.
class ImagesByPath
{
public:
    explicit ImagesByPath(const TagFile& file);

    /// What the image shows, without its place in that tag file; null when the file at the path is not among them.
    std::unique_ptr<TagMap> copy(const std::string& path) const;

    bool contains(const QByteArray& path) const { return mImages.contains(path); }

private:
    QHash<QByteArray, const TagMap*> mImages;
};

/// What files of a study say of their images, read ahead.
class ImagesAhead
{
public:
    /// `threads` as in `ThreadShare`.
    ImagesAhead(const QList<QByteArray>& paths, const QList<QByteArray>& urls, int threads)
        : mPaths(paths)
        , mUrls(urls)
        , mFiles(paths, threads, kDefaultValueBound)
        , mObjects(urls, {}, kDefaultValueBound)
    {
    }

    /// The image of a file; null when that is not the next one or has to be loaded otherwise. `object` has then what else
    /// was found out of one behind a URL. Asked for in the order of the paths, and of the URLs.
    std::unique_ptr<TagMap> take(const QByteArray& path, ObjectRead& object);

private:
    QList<QByteArray> mPaths;  // that were not taken
    QList<QByteArray> mUrls;   // likewise
    PlainFiles mFiles;
    PlainObjects mObjects;
};

/// What a study is built from.
struct StudySources
{
    /// `loadedBefore` has images as they come from their files, and must outlive the object.
    explicit StudySources(const TagFile& loadedBefore)
        : loaded(loadedBefore)
        , formerImages(former)
    {
    }

    /// Asks the database and reads the study's present tag file. Corrections that only that one tells of are recorded
    /// first, so that building has one source for all. False, with the reason logged, when something cannot be had.
    bool collect(const QByteArray& user, int studyId);

    /// The files that a build loads, in its order, on `threads` as in `ThreadShare`.
    ImagesAhead readAhead(int threads) const;

    /// Whether an image, as corrections make it, is the one that the database lists for the file. A file may have been
    /// given other content since it was registered.
    bool isListed(const TagMap& image, const QByteArray& path) const;

    /// Whether what was loaded before is what a build makes of the files and corrections: all of them, in the order of the
    /// build, and nothing else.
    bool isLoadedWhole(const TagFile& loadedBefore) const;

    /// What the present tag file has of the image listed for the file, as corrections make it; null when it has nothing
    /// of that.
    std::unique_ptr<TagMap> copyFormer(const std::string& path) const;

    std::vector<std::string> dicomFiles;
    std::vector<std::string> volumeFiles;
    std::vector<std::string> seriesWithVolumeFile;
    BuildCorrections corrections;
    ImagesByPath loaded;
    TagFile former;  ///< the present tag file; empty when there is none that can be read
    ImagesByPath formerImages;
    std::unique_ptr<AdoptedCorrections> adopted;
    QSet<QByteArray> kept;  ///< paths whose images are as the present tag file has them
    KeptDatasets datasets;

private:
    struct Listed
    {
        QByteArray seriesUID;
        QByteArray key;
    };

    bool query(const QByteArray& user, int studyId);
    Result queryImages();
    bool readFormer();

    QHash<QByteArray, Listed> mListed;  // by path
    QSet<QByteArray> mKeys;             // of the images that are listed
};

}  // namespace Kdd
