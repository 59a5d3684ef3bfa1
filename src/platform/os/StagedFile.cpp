#include "platform/os/StagedFile.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <cerrno>

namespace Kdd
{

namespace
{

constexpr mode_t kFileMode = 0666;    // less the umask
constexpr mode_t kFolderMode = 0777;  // likewise

SystemResult resultOf(int answer)
{
    return SystemResult::of(answer == 0 ? 0 : errno);
}

}  // namespace

// ---- the file

StagedFile::~StagedFile()
{
    close();
    if (!mPath.isEmpty() && !mIsKept)
        ::unlink(mPath.constData());
}

void StagedFile::close()
{
    if (mDescriptor >= 0)
        ::close(mDescriptor);
    mDescriptor = -1;
}

SystemResult StagedFile::create(const QByteArray& path)
{
    mDescriptor = ::open(path.constData(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, kFileMode);
    if (mDescriptor < 0)
        return SystemResult::of(errno);
    mPath = path;
    return {};
}

SystemResult StagedFile::append(const char* bytes, qint64 count)
{
    while (count > 0) {
        const ssize_t written = ::write(mDescriptor, bytes, static_cast<std::size_t>(count));
        if (written < 0 && errno != EINTR)
            return SystemResult::of(errno);
        // A short write is an answer, not a fault: the rest goes next, and tells what is wrong.
        const qint64 done = written > 0 ? written : 0;
        bytes += done;
        count -= done;
        mSize += done;
    }
    return {};
}

void StagedFile::startFlush() const
{
    ::sync_file_range(mDescriptor, 0, 0, SYNC_FILE_RANGE_WRITE);
}

SystemResult StagedFile::flush()
{
    SystemResult flushed = resultOf(::fdatasync(mDescriptor));
    close();
    return flushed;
}

SystemResult StagedFile::linkTo(const QByteArray& path) const
{
    return resultOf(::link(mPath.constData(), path.constData()));
}

// ---- folders

SystemResult flushFolder(const QByteArray& path)
{
    const int folder = ::open(path.constData(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (folder < 0)
        return SystemResult::of(errno);
    // EINVAL: a file system that knows no flushing of folders, so nothing is left to do.
    const int error = ::fsync(folder) == 0 || errno == EINVAL ? 0 : errno;
    ::close(folder);
    return SystemResult::of(error);
}

SystemResult makeLastingFolder(const QByteArray& path)
{
    struct stat status = {};
    if (::stat(path.constData(), &status) == 0)
        return S_ISDIR(status.st_mode) ? SystemResult() : SystemResult::of(ENOTDIR);
    const int slash = path.lastIndexOf('/');
    const QByteArray above = slash > 0 ? path.left(slash) : QByteArray(slash == 0 ? "/" : ".");
    SystemResult made = above == path ? SystemResult::of(ENOENT) : makeLastingFolder(above);
    // Whoever made it in between may not have flushed it yet.
    if (made.good() && ::mkdir(path.constData(), kFolderMode) != 0 && errno != EEXIST)
        made = SystemResult::of(errno);
    return made.good() ? flushFolder(above) : made;
}

qint64 freeSpace(const QByteArray& path)
{
    struct statvfs status = {};
    if (::statvfs(path.constData(), &status) != 0)
        return -1;
    return static_cast<qint64>(status.f_bavail) * static_cast<qint64>(status.f_frsize);
}

int linkCount(const QByteArray& path)
{
    struct stat status = {};
    return ::lstat(path.constData(), &status) == 0 ? static_cast<int>(status.st_nlink) : 0;
}

bool isSameFile(const QByteArray& path, const QByteArray& other)
{
    struct stat one = {};
    struct stat two = {};
    return ::lstat(path.constData(), &one) == 0 && ::lstat(other.constData(), &two) == 0 &&
           one.st_dev == two.st_dev && one.st_ino == two.st_ino;
}

// ---- the lock

LockFile::~LockFile()
{
    if (mDescriptor >= 0)
        ::close(mDescriptor);
}

SystemResult LockFile::acquire(const QByteArray& path, IfHeld ifHeld)
{
    mDescriptor = ::open(path.constData(), O_RDWR | O_CREAT | O_CLOEXEC, kFileMode);
    if (mDescriptor < 0)
        return SystemResult::of(errno);
    const int how = LOCK_EX | (ifHeld == IfHeld::Fail ? LOCK_NB : 0);
    int answer = ::flock(mDescriptor, how);
    while (answer != 0 && errno == EINTR)
        answer = ::flock(mDescriptor, how);
    return resultOf(answer);
}

}  // namespace Kdd
