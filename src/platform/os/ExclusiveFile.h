#pragma once

#include "platform/base/Export.h"
#include "platform/base/IfAbsent.h"
#include "platform/os/SystemResult.h"

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

/// True when the file is open. Otherwise the errno that belongs to `failure`, 0 when it is open.
struct LockedOpenResult
{
    OpenFailure failure = OpenFailure::None;
    int systemError = 0;

    explicit operator bool() const { return failure == OpenFailure::None; }

    /// The same with the reason in words.
    SystemResult result() const
    {
        return failure == OpenFailure::Locked
                   ? SystemResult::failure(systemError, QStringLiteral("others hold it"))
                   : SystemResult::of(systemError);
    }
};

/// Opens `path` under the lock into `file`, which has to be closed, at offset 0 and without ever truncating it: whoever
/// wants it empty truncates it under the lock. Shared opens it read-only, Exclusive for reading and writing. With
/// IfAbsent::Create a missing file is made (mode 0666 less the umask).
///
/// It is the file that bore the name at some moment under the lock, never one that was deleted or replaced before the
/// lock was gained. Closing `file` ends the lock. As always with a QFile that is opened by descriptor, its fileName() is
/// empty afterwards. On failure `file` stays closed.
KDD_EXPORT LockedOpenResult openLockedFile(QFile& file, const QString& path, FileLock lock, IfAbsent ifAbsent,
                                           LockPolling polling);

/// Deletes the file at `path`, which `lockedFile` holds exclusively, and closes `lockedFile` in any case. A file
/// that is gone already counts as deleted.
///
/// This is the one safe way to delete: those who wait for the lock notice and open the name anew.
KDD_EXPORT SystemResult removeLocked(QFile& lockedFile, const QString& path);

}  // namespace Kdd
