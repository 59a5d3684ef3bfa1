#include "platform/os/RandomAccessFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

namespace Kdd
{

namespace
{

FileIdentity identityOf(const struct stat& status)
{
    return {status.st_dev, status.st_ino, status.st_size,
            status.st_mtim.tv_sec * qint64(1'000'000'000) + status.st_mtim.tv_nsec};
}

}  // namespace

RandomAccessFile::~RandomAccessFile()
{
    if (mDescriptor >= 0)
        ::close(mDescriptor);
}

SystemResult RandomAccessFile::open(const char* path)
{
    // A pipe in place of a file would hold the caller until somebody writes to it.
    mDescriptor = ::open(path, O_RDONLY | O_CLOEXEC | O_NONBLOCK);
    struct stat status = {};
    if (mDescriptor < 0 || ::fstat(mDescriptor, &status) != 0)
        return SystemResult::of(errno);
    if (S_ISDIR(status.st_mode))
        return SystemResult::of(EISDIR);
    // Devices and pipes have no size to hold claims against.
    if (!S_ISREG(status.st_mode))
        return SystemResult::of(EINVAL);
    mIdentity = identityOf(status);
    return {};
}

bool RandomAccessFile::isUnchanged() const
{
    // The open file is asked and not its name: another file put in its place leaves the bytes read here as
    // they were.
    struct stat status = {};
    return ::fstat(mDescriptor, &status) == 0 && identityOf(status) == mIdentity;
}

void RandomAccessFile::askFor(qint64 offset, qint64 count) const
{
    ::posix_fadvise(mDescriptor, offset, count, POSIX_FADV_WILLNEED);
}

qint64 RandomAccessFile::readAt(qint64 offset, void* bytes, qint64 count) const
{
    qint64 done = 0;
    while (done < count) {
        // By offset, since any number of threads read over the one descriptor.
        const ssize_t got = ::pread(mDescriptor, static_cast<char*>(bytes) + done,
                                    static_cast<size_t>(count - done), offset + done);
        if (got < 0 && errno == EINTR)
            continue;
        if (got < 0)
            return -1;
        if (got == 0)
            break;
        done += got;
    }
    return done;
}

}  // namespace Kdd
