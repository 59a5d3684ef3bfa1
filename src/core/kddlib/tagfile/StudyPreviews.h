#pragma once

#include <QByteArray>
#include <QList>

class DcmDataset;
class QString;

namespace Kdd
{

class StudyTree;
class TagMap;

// Previews of the images of a study, of the size that the settings say.

/// The images that get a preview of their own: those that no volume shows, all of a short series, a representative one
/// of a long series and of each special kind (ultrasound, captures, localizers).
QList<QByteArray> selectPreviewImages(const StudyTree& tree);

/// Make and keep the preview of an image, and of a mammogram where the breast lies. False when there is no image, or it
/// cannot be loaded or shown, which is logged with the path.
bool addPreview(TagMap* image, DcmDataset* dataset, const QString& path);
bool addPreview(TagMap* image, const QByteArray& file);

/// The same for the image that the tree holds of the dataset.
bool addPreview(const StudyTree& tree, DcmDataset* dataset, const QString& path);

/// Writes every preview to a folder as "HASH_Series_N_Image_N.jpg" and "HASH_Series_N_Volume_N.jpg". A file that cannot
/// be written is warned about and passed over. How many were written.
int exportPreviews(const StudyTree& tree, const QString& folder);

}  // namespace Kdd
