#pragma once

#include "platform/base/Export.h"

#include <QString>

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

/// What can be told of a file without opening it. One without bytes was just being made, perhaps by a process that died.
enum class FilePresence { Absent, Empty, Filled };
KDD_EXPORT FilePresence presenceOf(const QString& path);

}  // namespace Kdd
