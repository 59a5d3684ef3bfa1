#pragma once

#include "platform/base/Export.h"
#include "platform/base/Result.h"

#include <QByteArray>

#include <functional>

namespace Kdd
{

class TagMap;
struct Stack;

/// Where the DICOM file of an image lies; empty when it has none.
using ImagePath = std::function<QByteArray(const TagMap& image)>;

/// Decodes the slices of a planned stack, one after the other, into a volume file: their pixels as the lattice "Level0",
/// with the histogram and all parameters that a reader needs to show the volume and to find its images again.
///
/// Pixels stay as they are stored if all slices mean the same by them; see `StackValues`. The same stack always gives
/// the same parameters and pixels. Slices of multi-frame images are named "UID.frame", 0-based.
///
/// Failure, and no file: an image has no file, or another than was planned with, it cannot be decoded, or the volume
/// cannot be written. The result names the file.
KDD_EXPORT Result writeStack(const Stack& stack, const ImagePath& pathOf, const QByteArray& volumePath);

/// The file name of the `index`-th (0-based) stack of a series: "UID-volume.vol", "UID-volume_part002.vol" and so on.
/// The first has no part number, because the volume index of a file is its part number less 1, and that of a
/// file without one is 0. Whatever a UID should not hold is written as %XX, so that it names no folder.
KDD_EXPORT QByteArray volumeFileName(const QByteArray& seriesUID, int index);

}  // namespace Kdd
