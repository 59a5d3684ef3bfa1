#pragma once

#include "server/dicomweb/ResourcePath.h"
#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/Verdict.h"

#include <QVector>

#include <kddlib/CorrectedDataset.h>

#include <memory>

namespace Kdd
{
class TagMap;
}

namespace Kdd::DicomWeb
{

/// The study that a path names; 404 when there is none, 503 while others hold it, 500 when its tag file is missing or damaged.
Verdict findStudy(StudyShelf& shelf, const ResourcePath& path, std::shared_ptr<const ServedStudy>& study);

/// The image that the path names within the study, where the tag file shows it now; null when there is none. To be
/// called, and the image to be used, within a look.
const TagMap* findImage(const TagFile& file, const ResourcePath& path);

/// One image of a study, to be looked up again for as long as the study is served.
struct ListedImage
{
    QByteArray key;  ///< as the tag file knows it
    QByteArray seriesUID;
    QByteArray sopUID;  ///< empty in the few kinds of objects that have none
};

/// The images of a study, a series or an instance, as the path says, in the tag file's order; 404 when there are none.
Verdict listImages(const ServedStudy& study, const ResourcePath& path, QVector<ListedImage>& images);

/// What is needed of an image outside of a look: where its file is, and, if `map` is not null, a copy of all it shows.
Verdict takeImage(const ServedStudy& study, const QByteArray& key, ImageOrigin& origin,
                  std::unique_ptr<TagMap>* map);

}  // namespace Kdd::DicomWeb
