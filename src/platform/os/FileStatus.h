#pragma once

#include "platform/base/Export.h"

#include <QtGlobal>

namespace Kdd
{

/// What tells whether a file changed since it was last looked at.
struct FileStatus
{
    qint64 size = 0;      ///< [bytes]
    qint64 modified = 0;  ///< [ns] since the epoch
};

/// Links are followed. False when there is no such file or it cannot be asked for.
KDD_EXPORT bool statusOf(const char* path, FileStatus& status);

}  // namespace Kdd
