#include "platform/os/FileStatus.h"

#include "platform/os/PathName.h"

#include <sys/stat.h>

namespace Kdd
{

bool statusOf(const char* path, FileStatus& status)
{
    struct stat found = {};
    if (stat(path, &found) != 0)
        return false;
    constexpr qint64 kNanosecondsPerSecond = 1000000000;
    status.size = found.st_size;
    // Nanoseconds: a file can be written anew within a second and have the same size.
    status.modified = found.st_mtim.tv_sec * kNanosecondsPerSecond + found.st_mtim.tv_nsec;
    return true;
}

FilePresence presenceOf(const QString& path)
{
    FileStatus status;
    if (!statusOf(pathBytes(path).constData(), status))
        return FilePresence::Absent;
    return status.size == 0 ? FilePresence::Empty : FilePresence::Filled;
}

}  // namespace Kdd
