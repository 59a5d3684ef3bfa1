#include "kddlib/tagfile/StudyFile.h"

#include "kddlib/tagfile/TagFileSettings.h"
#include "platform/os/PathName.h"
#include "platform/os/StagedFile.h"
#include "platform/resources/ExResource.h"

#include <QFileInfo>

namespace Kdd
{

namespace
{

// A correction or a reader gives up soon, for its caller can try again; who writes would lose what it made.
constexpr LockPolling kReadPolling{20, 20};
constexpr LockPolling kWritePolling{100, 20};

using Access = StudyFile::Access;

FileLock lockFor(Access access)
{
    return access == Access::Read || access == Access::ReadWaiting ? FileLock::Shared : FileLock::Exclusive;
}

bool makesFile(Access access)
{
    return access == Access::HoldOrMake || access == Access::WriteOrMake;
}

LockPolling pollingFor(Access access)
{
    LockPolling polling = access == Access::WriteOrMake ? kWritePolling : kReadPolling;
    if (access == Access::ReadWaiting || access == Access::HoldWaiting)
        // The site's patience can only prolong: an ordinary reader
        // never waits longer than one that serves others.
        polling.attempts = qMax(polling.attempts, ExResource::readPatience() / polling.delayMs);
    return polling;
}

Flush flushing()
{
    return TagFileSettings::durability() == TagFileSettings::Durability::PowerLoss ? Flush::Disk
                                                                                   : Flush::Process;
}

}  // namespace

bool makeStudyFolder(const QString& path)
{
    return flushing() == Flush::Disk ? makeLastingFolder(pathBytes(path)).good() : makeFolder(path);
}

LockedOpenResult StudyFile::open(const QString& path, Access access)
{
    mPath = path;
    const auto attempt = [&] {
        return openLockedFile(mFile, path, lockFor(access),
                              makesFile(access) ? IfAbsent::Create : IfAbsent::Fail, pollingFor(access));
    };
    // Without making the folder first: nearly always it is there.
    LockedOpenResult opened = attempt();
    if (opened || opened.failure == OpenFailure::Locked || !makesFile(access))
        return opened;
    if (!makeStudyFolder(QFileInfo(path).path())) {
        opened.failure = OpenFailure::NotFound;
        return opened;
    }
    // Another process may have made the folder between the two questions, so what failed is tried again anyhow.
    return attempt();
}

QByteArray StudyFile::content()
{
    mFile.seek(0);
    return mFile.readAll();
}

Result StudyFile::recover()
{
    return recoverInterruptedWrite(mFile, mPath, flushing());
}

Result StudyFile::write(const QByteArray& content, Tail tail)
{
    return writeInPlace(mFile, mPath, content, {flushing(), tail});
}

Result StudyFile::remove()
{
    return removeWithJournal(mFile, mPath);
}

void StudyFile::removeIfNeverWritten()
{
    // A journal is a promise to whoever opens the file next, and needs the file to stay.
    if (isOpen() && isEmpty() && !hasJournal())
        removeLocked(mFile, mPath);
}

}  // namespace Kdd
