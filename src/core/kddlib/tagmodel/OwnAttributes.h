#pragma once

#include "platform/base/Export.h"

#include <QByteArray>

#include <dcmtk/dcmdata/dctagkey.h>

namespace Kdd
{

class TagMap;

// The attributes that are ours and no DICOM object's. Group 0006 is left free by DICOM; the numbers stand in tag files
// and are never changed.

inline const DcmTagKey kFilePath(0x0006, 0x7100);  ///< of an image: where its DICOM file lies
inline const DcmTagKey kFileSuffix(0x0006,
                                   0x7101);  ///< of an image: what tells the files of one instance apart
inline const DcmTagKey kTransferSyntax(0x0006, 0x7102);  ///< one byte: what the dataset was read in
inline const DcmTagKey kVolumeIndex(0x0006, 0x7103);  ///< of an image: one byte for each volume it belongs to
inline const DcmTagKey kPreview(0x0006, 0x7105);      ///< of an image: JPEG
inline const DcmTagKey kPreviewIndex(0x0006, 0x7106);   ///< stands for the preview inside the tag file
inline const DcmTagKey kFromDatabase(0x0006, 0x7107);   ///< 1 on a study that the image database knows
inline const DcmTagKey kHasVolumeFile(0x0006, 0x7108);  ///< 1 on a series that has a volume file
inline const DcmTagKey kAbstract(0x0006, 0x7120);       ///< of a series: its label

/// The creator of our private attributes, all in group 0071.
constexpr const char* kOurPrivateCreator = "Korvex";

/// Where the image's DICOM file lies; empty when that is not known.
KDD_EXPORT QByteArray filePathOf(const TagMap& image);

/// The image that speaks for a series or study where its images differ: the first by path. What the node itself holds is
/// only what costs least to store, and the order of its children that of arrival. Null: it has no images. Owned by the
/// tree.
KDD_EXPORT const TagMap* describingImage(const TagMap& node);

/// A path as it is kept in (0006,7100), whatever system it was written on.
KDD_EXPORT QByteArray forwardSlashes(QByteArray path);

}  // namespace Kdd
