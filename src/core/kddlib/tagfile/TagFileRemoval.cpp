#include "kddlib/tagfile/TagFileRemoval.h"

#include "platform/base/LogFile.h"
#include "platform/os/ExclusiveFile.h"
#include "platform/os/JournaledWrite.h"

#include <QFile>

#include <cerrno>
#include <chrono>
#include <thread>

namespace Kdd
{

namespace
{

const char* const kCategory = "TagFile";
constexpr int kRetries = 5;
constexpr std::chrono::milliseconds kPause(10);
constexpr LockPolling kOnce{1, 0};

}  // namespace

int removeTagFileOnce(const QString& path)
{
    QFile file;
    const LockedOpenResult opened = openLockedFile(file, path, FileLock::Exclusive, IfAbsent::Fail, kOnce);
    if (!opened)
        return opened.failure == OpenFailure::NotFound ? 0 : opened.systemError;
    errno = 0;
    if (removeWithJournal(file, path).isEmpty())
        return 0;
    return errno != 0 ? errno : EIO;
}

bool removeTagFile(const QString& path, const RemovalAttempt& attempt)
{
    int error = attempt(path);
    if (error == 0)
        return true;
    for (int retry = 1; retry <= kRetries; ++retry) {
        std::this_thread::sleep_for(kPause);
        error = attempt(path);
        if (error == 0) {
            LogFile::tracef(0, kCategory, "Tag file %s successfully deleted after %d retries",
                            qUtf8Printable(path), retry);
            return true;
        }
    }
    LogFile::tracef(3, kCategory, "Tag file %s could not be deleted (errno %d)", qUtf8Printable(path), error);
    return false;
}

}  // namespace Kdd
