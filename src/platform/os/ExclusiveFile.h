#pragma once

#include "platform/base/Export.h"

#include <QString>

class QFile;

namespace Kdd
{

/// Shared: opened for reading, beside any number of other readers. Exclusive: opened for reading and writing, alone.
///
/// The locks are advisory: they hold between all who open the file by the functions below (or by flock), in this
/// process and in others. They belong to the open descriptor and end when it is closed, also by the death of the
/// process. A child that is forked shares them; a program that is started does not.
enum class FileLock { Shared, Exclusive };

/// What to do when there is no file: fail, or create an empty one (mode 0666 less the umask).
enum class IfAbsent { Fail, Create };

/// How long to try while others hold the file: `attempts` times (fewer than 1 counts as 1) with pauses of `delayMs`
/// [ms] between them, so that one attempt never pauses.
struct LockPolling
{
    int attempts;
    int delayMs;
};

/// Locked: until the last attempt others held the file, or replaced it while it was being opened.
/// NotFound: the file is absent, or with IfAbsent::Create its folder. System: any other refusal of the system.
/// Only Locked is tried again; the other two are reported at once.
enum class OpenFailure { None, NotFound, Locked, System };

/// True when the file is open. Otherwise `fd` is -1 and `systemError` the errno that belongs to `failure`.
struct LockedOpenResult
{
    int fd = -1;
    OpenFailure failure = OpenFailure::None;
    int systemError = 0;

    explicit operator bool() const { return fd >= 0; }
};

/// Opens `path` under the lock, at offset 0 and without ever truncating it: whoever wants it empty truncates it
/// under the lock. The caller owns the descriptor. It is the file that bore the name at some moment under the lock,
/// never one that was deleted or replaced before the lock was gained.
KDD_EXPORT LockedOpenResult openLocked(const QString& path, FileLock lock, IfAbsent ifAbsent,
                                       LockPolling polling);

/// The same into `file`, which has to be closed: Shared opens it read-only, Exclusive for reading and writing. The
/// descriptor in the result belongs to `file` then, and closing `file` ends the lock. As always with a QFile that is
/// opened by descriptor, its fileName() is empty afterwards. On failure `file` stays closed.
KDD_EXPORT LockedOpenResult openLockedFile(QFile& file, const QString& path, FileLock lock, IfAbsent ifAbsent,
                                           LockPolling polling);

/// Deletes the file at `path`, which `lockedFile` holds exclusively, and closes `lockedFile` in any case. False, with
/// the reason in errno, when the system refuses; a file that is gone already counts as deleted.
///
/// This is the one safe way to delete: those who wait for the lock notice and open the name anew.
KDD_EXPORT bool removeLocked(QFile& lockedFile, const QString& path);

}  // namespace Kdd
