#include "platform/os/ExclusiveFile.h"

#include "platform/os/PathName.h"

#include <QFile>

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <thread>

namespace Kdd
{
namespace
{

int openDescriptor(const QByteArray& path, FileLock lock, IfAbsent ifAbsent)
{
    // An exclusive lock on a network mount needs a writable descriptor.
    const int access = lock == FileLock::Shared ? O_RDONLY : O_RDWR;
    const int creation = ifAbsent == IfAbsent::Create ? O_CREAT : 0;
    int fd = -1;
    // A signal may interrupt the opening on a slow mount. That says nothing of the file.
    do {
        // A pipe of that name would be waited for without end.
        fd = ::open(path.constData(), access | creation | O_CLOEXEC | O_NONBLOCK, 0666);
    } while (fd < 0 && errno == EINTR);
    return fd;
}

/// 0, or the errno.
int takeLock(int fd, FileLock lock)
{
    const int operation = lock == FileLock::Shared ? LOCK_SH : LOCK_EX;
    // Never waiting in the system: a wait there has no end when its holder hangs, and this one is counted.
    while (::flock(fd, operation | LOCK_NB) != 0) {
        if (errno != EINTR)
            return errno;
    }
    return 0;
}

/// 0 while the descriptor is the file at `path`; ESTALE when that was deleted or replaced between opening and
/// locking, so that the lock is on a file nobody else will find; another errno for any other fault.
int checkIdentity(int fd, const QByteArray& path)
{
    struct stat opened = {};
    struct stat named = {};
    if (::fstat(fd, &opened) != 0)
        return errno;
    // A folder can be opened and locked for reading as a file can, so it has to be refused here.
    if (!S_ISREG(opened.st_mode))
        return S_ISDIR(opened.st_mode) ? EISDIR : EINVAL;
    if (::stat(path.constData(), &named) != 0)
        return errno == ENOENT ? ESTALE : errno;
    const bool same = opened.st_dev == named.st_dev && opened.st_ino == named.st_ino;
    return same && opened.st_nlink > 0 ? 0 : ESTALE;
}

LockedOpenResult failure(int error)
{
    // Both pass with time: somebody holds the file, or it was replaced and the next opening finds its
    // successor.
    if (error == EWOULDBLOCK || error == ESTALE)
        return {OpenFailure::Locked, error};
    return {error == ENOENT ? OpenFailure::NotFound : OpenFailure::System, error};
}

/// `fd` is the caller's when the attempt succeeds.
LockedOpenResult tryOnce(const QByteArray& path, FileLock lock, IfAbsent ifAbsent, int& fd)
{
    fd = openDescriptor(path, lock, ifAbsent);
    if (fd < 0)
        return failure(errno);
    int error = takeLock(fd, lock);
    // Between opening and locking the holder before us may have deleted the file.
    if (error == 0)
        error = checkIdentity(fd, path);
    if (error == 0)
        return {};
    // Closing also gives back a lock that was gained on a file nobody else will find.
    ::close(fd);
    return failure(error);
}

LockedOpenResult openLocked(const QString& path, FileLock lock, IfAbsent ifAbsent, LockPolling polling,
                            int& fd)
{
    const QByteArray name = pathBytes(path);
    const int attempts = std::max(polling.attempts, 1);
    for (int attempt = 1;; ++attempt) {
        const LockedOpenResult result = tryOnce(name, lock, ifAbsent, fd);
        if (result.failure != OpenFailure::Locked || attempt == attempts)
            return result;
        // A deleted or replaced file is no reason to wait: its successor may be free at this moment.
        if (result.systemError != ESTALE)
            std::this_thread::sleep_for(std::chrono::milliseconds(polling.delayMs));
    }
}

}  // namespace

LockedOpenResult openLockedFile(QFile& file, const QString& path, FileLock lock, IfAbsent ifAbsent,
                                LockPolling polling)
{
    int fd = -1;
    const LockedOpenResult result = openLocked(path, lock, ifAbsent, polling, fd);
    if (!result)
        return result;
    const auto mode = lock == FileLock::Shared ? QIODevice::ReadOnly : QIODevice::ReadWrite;
    if (file.open(fd, mode, QFileDevice::AutoCloseHandle))
        return result;
    // The QFile was open already and has not taken the descriptor.
    ::close(fd);
    return failure(EBUSY);
}

SystemResult removeLocked(QFile& lockedFile, const QString& path)
{
    // Under the lock up to here: unlinking after the close could hit the file of whoever comes next.
    const bool isRemoved = ::unlink(pathBytes(path).constData()) == 0 || errno == ENOENT;
    const int error = isRemoved ? 0 : errno;
    lockedFile.close();
    return SystemResult::of(error);
}

}  // namespace Kdd
