#include "platform/os/StagedFile.h"

#include "platform/os/RandomAccessFile.h"

#include <fcntl.h>
#include <libdeflate.h>
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

constexpr qint64 kBlock = 256 * 1024;  // [bytes]

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
        mChecksum = libdeflate_crc32(mChecksum, bytes, static_cast<std::size_t>(done));
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

SystemResult StagedFile::rename(const QByteArray& path)
{
    if (::rename(mPath.constData(), path.constData()) != 0)
        return SystemResult::of(errno);
    mPath = path;
    return {};
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

SystemResult flushFile(const QByteArray& path)
{
    const int file = ::open(path.constData(), O_RDONLY | O_CLOEXEC);
    if (file < 0)
        return SystemResult::of(errno);
    const SystemResult flushed = resultOf(::fdatasync(file));
    ::close(file);
    return flushed;
}

SystemResult flushNamedFile(const QByteArray& path)
{
    const SystemResult flushed = flushFile(path);
    return flushed.good() ? flushFolder(path.left(path.lastIndexOf('/'))) : flushed;
}

SystemResult readChecksum(const QByteArray& path, quint32& checksum)
{
    RandomAccessFile file;
    const SystemResult opened = file.open(path.constData());
    if (opened.bad())
        return opened;
    QByteArray block(kBlock, Qt::Uninitialized);
    quint32 found = 0;
    qint64 at = 0;
    for (qint64 count = kBlock; count > 0; at += count) {
        count = file.readAt(at, block.data(), kBlock);
        if (count < 0)
            return SystemResult::of(errno);
        found = libdeflate_crc32(found, block.constData(), static_cast<std::size_t>(count));
    }
    checksum = found;
    return {};
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
