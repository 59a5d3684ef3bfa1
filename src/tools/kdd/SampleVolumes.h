#pragma once

#include <QString>

#include <kddlib/Result.h>

namespace Kdd
{

/// Makes the volume files of the CT series that `writeSampleStudies` wrote below a folder, each beside the images that
/// it was made from. `volumes` and `bytes` receive how many there are and what they take [bytes].
Result writeSampleVolumes(const QString& folder, int& volumes, qint64& bytes);

}  // namespace Kdd
