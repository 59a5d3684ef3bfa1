#include "kddlib/tagfile/TagFileRemoval.h"

#include "platform/base/LogFile.h"
#include "platform/os/ExclusiveFile.h"
#include "platform/os/JournaledWrite.h"

#include <QFile>

#include <chrono>
#include <thread>

namespace Kdd
{

namespace
{

const char* const kCategory = "TagFile";
constexpr int kRetries = 5;
constexpr std::chrono::milliseconds kPause(10);
constexpr LockPolling kOnce{1, 0};  // who removes has its own pauses, and tells how many it took

}  // namespace

SystemResult removeTagFileOnce(const QString& path)
{
    // Through the lock: a file deleted under a writer would take with it what that writes.
    QFile file;
    const LockedOpenResult opened = openLockedFile(file, path, FileLock::Exclusive, IfAbsent::Fail, kOnce);
    if (opened)
        return removeWithJournal(file, path);
    // What is not there need not be removed.
    return opened.failure == OpenFailure::NotFound ? SystemResult() : opened.result();
}

bool removeTagFile(const QString& path, const RemovalAttempt& attempt)
{
    SystemResult result = attempt(path);
    if (result.good())
        return true;
    for (int retry = 1; retry <= kRetries; ++retry) {
        std::this_thread::sleep_for(kPause);
        result = attempt(path);
        if (result.good()) {
            LogFile::tracef(0, kCategory, "Tag file %s successfully deleted after %d retries",
                            qUtf8Printable(path), retry);
            return true;
        }
    }
    LogFile::tracef(3, kCategory, "Tag file %s could not be deleted (errno %d)", qUtf8Printable(path),
                    result.error());
    return false;
}

}  // namespace Kdd
