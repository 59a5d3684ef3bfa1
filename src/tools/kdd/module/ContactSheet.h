#pragma once

#include <QString>

#include <kddlib/Result.h>

namespace Kdd
{

/// Puts the JPEG pictures of a folder side by side into one picture, in the order of their names, row by row. The
/// ending of `path` decides its format. Pictures that cannot be read leave their place empty. Of very many pictures the
/// first 2,000 are shown.
Result writeContactSheet(const QString& folder, const QString& path);

}  // namespace Kdd
