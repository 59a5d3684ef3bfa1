#pragma once

#include "platform/base/Result.h"

#include <QByteArray>

class DcmDataset;

namespace Kdd
{

/// Makes the attributes that tell how pixels are stored fit to those that were decoded or encoded: samples side by side,
/// no offsets beside them, and colours that mean `photometric`, where that is not empty.
void describePixels(DcmDataset& dataset, const QByteArray& photometric);

/// Decodes the icons in a dataset's sequences, which are compressed as the image is.
Result decodeIcons(DcmDataset& dataset);

}  // namespace Kdd
