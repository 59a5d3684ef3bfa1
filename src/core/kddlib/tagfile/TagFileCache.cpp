#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "platform/base/Stopwatch.h"
#include "platform/os/ExclusiveFile.h"
#include "platform/os/JournaledWrite.h"
#include "platform/os/PathName.h"
#include "platform/resources/ExResource.h"

#include <QCryptographicHash>
#include <QDataStream>
#include <QFileInfo>

#include <cerrno>
#include <cstring>

namespace Kdd
{

namespace
{

constexpr LockPolling kReadPolling{20, 20};
constexpr LockPolling kWritePolling{100, 20};

QString systemText(int error)
{
    return QString::fromLocal8Bit(std::strerror(error));
}

}  // namespace

QString TagFile::cacheFilePathForStudy(const char* studyUID)
{
    const QByteArray hash =
        QCryptographicHash::hash(QByteArray(studyUID) + '\n', QCryptographicHash::Md5).toHex();
    return pathText(metaFolder()) +
           QString::fromLatin1(hash.left(2) + '/' + hash.mid(2, 2) + '/' + hash.mid(4) + ".tc");
}

QString TagFile::cacheFilePath() const
{
    return cacheFilePathForStudy(studyInstanceUID().constData());
}

bool TagFile::readCacheFileForStudy(const char* studyUID, bool keepOpen)
{
    return readCacheFile(cacheFilePathForStudy(studyUID), studyUID, keepOpen);
}

bool TagFile::readCacheFile(const QString& path, const char* studyUID, bool keepOpen)
{
    return readFile(path, studyUID, keepOpen, Reader::Ordinary);
}

bool TagFile::readWhenFreeForStudy(const char* studyUID, bool keepOpen)
{
    return readWhenFree(cacheFilePathForStudy(studyUID), studyUID, keepOpen);
}

bool TagFile::readWhenFree(const QString& path, const char* studyUID, bool keepOpen)
{
    return readFile(path, studyUID, keepOpen, Reader::Serving);
}

LockPolling TagFile::pollingOf(Reader reader)
{
    LockPolling polling = kReadPolling;
    if (reader == Reader::Serving)
        polling.attempts = qMax(polling.attempts, ExResource::readPatience() / polling.delayMs);
    return polling;
}

bool TagFile::readFile(const QString& path, const char* studyUID, bool keepOpen, Reader reader)
{
    const Stopwatch stopwatch;
    const QByteArray wanted(studyUID);  // may be that of the study that is let go of now
    mLockedOut = false;
    if (mCacheFile.isOpen()) {
        LogFile::warnf("Tag file already opened");
        return fail(QStringLiteral("Tag file already opened"));
    }
    clear();
    mFailure.clear();
    mCacheFilePath = path;
    if (!openForReading(path, keepOpen, reader))
        return false;
    QDataStream in(&mCacheFile);
    const bool isRead = readCacheFile(in, studyUID != nullptr ? wanted.constData() : nullptr);
    if (!isRead || !keepOpen)
        mCacheFile.close();
    mStatistics.readMs = stopwatch.elapsed();
    if (!isRead)
        LogFile::errorf("Could not read %s", qUtf8Printable(path));
    else if (LogFile::debugLogging())
        LogFile::printf("Cache file read in %d msec", mStatistics.readMs);
    return isRead;
}

/// Opens the cache file, exclusively if it is to be kept open. A reader that meets the journal of a writer that died
/// first finishes that write, for what the file holds may be torn.
bool TagFile::openForReading(const QString& path, bool keepOpen, Reader reader)
{
    if (keepOpen)
        return openWhole(path, reader);
    const LockedOpenResult opened =
        openLockedFile(mCacheFile, path, FileLock::Shared, IfAbsent::Fail, pollingOf(reader));
    if (!opened) {
        failToOpen(opened);
        const bool isTold = opened.failure == OpenFailure::Locked
                                ? reader == Reader::Ordinary
                                : opened.failure != OpenFailure::NotFound || LogFile::debugLogging();
        if (isTold)
            LogFile::warnf("Could not open %s: %s", qUtf8Printable(path), qUtf8Printable(mFailure));
        return false;
    }
    const bool isWhole = !hasJournal(path);
    // Its maker has not come to filling it yet, so the study has no tag file at this moment.
    if (isWhole && mCacheFile.size() == 0) {
        mCacheFile.close();
        mLockedOut = true;
        return fail(systemText(ENOENT));
    }
    if (isWhole)
        return true;
    mCacheFile.close();
    if (openWhole(path, reader))
        return true;
    if (!mLockedOut || reader == Reader::Ordinary)
        LogFile::warnf("Could not open %s: %s", qUtf8Printable(path), qUtf8Printable(mFailure));
    return false;
}

bool TagFile::openWhole(const QString& path, Reader reader)
{
    const LockedOpenResult opened =
        openLockedFile(mCacheFile, path, FileLock::Exclusive, IfAbsent::Fail, pollingOf(reader));
    return opened ? finishInterruptedWrite(path) : failToOpen(opened);
}

bool TagFile::failToOpen(const LockedOpenResult& opened)
{
    mLockedOut = opened.failure == OpenFailure::Locked;
    return fail(mLockedOut ? QStringLiteral("others hold it") : systemText(opened.systemError));
}

/// Opens the study's file exclusively and reads it. An absent or empty file holds no study, which is no failure.
bool TagFile::holdStudy(const QByteArray& studyUID, IfAbsent ifAbsent)
{
    clear();
    mFailure.clear();
    const QString path = cacheFilePathForStudy(studyUID.constData());
    mCacheFilePath = path;
    if (ifAbsent == IfAbsent::Create)
        makeFolder(QFileInfo(path).path());
    const LockedOpenResult opened =
        openLockedFile(mCacheFile, path, FileLock::Exclusive, ifAbsent, kReadPolling);
    mLockedOut = false;
    if (opened.failure == OpenFailure::NotFound && ifAbsent == IfAbsent::Fail)
        return true;
    if (!opened)
        return failToOpen(opened);
    if (!finishInterruptedWrite(path))
        return false;
    QDataStream in(&mCacheFile);
    if (mCacheFile.size() == 0 || readCacheFile(in, studyUID.constData()))
        return true;
    mCacheFile.close();
    return false;
}

/// What the last writer of the file, held exclusively now, did not bring to its end.
bool TagFile::finishInterruptedWrite(const QString& path)
{
    const QString reason = recoverInterruptedWrite(mCacheFile, path, flushing());
    if (reason.isEmpty())
        return true;
    mCacheFile.close();
    LogFile::errorf("Could not finish the interrupted write of %s: %s", qUtf8Printable(path),
                    qUtf8Printable(reason));
    return fail(reason);
}

bool TagFile::writeCacheFile()
{
    mFailure.clear();
    if (isEmpty()) {
        if (!mCacheFile.isOpen())
            return fail(QStringLiteral("No images to write"));
        const QString reason = removeWithJournal(mCacheFile, mCacheFilePath);
        return reason.isEmpty() || fail(reason);
    }
    if (!mCacheFile.isOpen())
        return createAndWrite(cacheFilePath());
    const bool isWritten = writeInto(mCacheFile, mCacheFilePath, false);
    mCacheFile.close();
    return isWritten;
}

bool TagFile::writeCacheFile(const char* path)
{
    mFailure.clear();
    return createAndWrite(pathText(path));
}

bool TagFile::createAndWrite(const QString& path)
{
    makeFolder(QFileInfo(path).path());
    QFile file;
    const LockedOpenResult opened =
        openLockedFile(file, path, FileLock::Exclusive, IfAbsent::Create, kWritePolling);
    mLockedOut = false;
    if (!opened) {
        LogFile::errorf("Could not open %s for writing", qUtf8Printable(path));
        return failToOpen(opened);
    }
    return writeInto(file, path, true);
}

/// Writes the whole object into a file that is held exclusively. An empty file that could not be filled is not left
/// behind.
bool TagFile::writeInto(QFile& locked, const QString& path, bool cut)
{
    const QByteArray content = serialized(sCompressionMode);
    QString reason = mFailure;
    if (!content.isEmpty())
        reason = writeInPlace(locked, path, content, {flushing(), cut ? Tail::Cut : Tail::Keep});
    if (!reason.isEmpty()) {
        LogFile::errorf("Could not write %s: %s", qUtf8Printable(path), qUtf8Printable(reason));
        if (locked.size() == 0 && !hasJournal(path))
            removeLocked(locked, path);
        return fail(reason);
    }
    mCacheFilePath = path;
    mStamp = {content.size(), QCryptographicHash::hash(content, QCryptographicHash::Md5)};
    if (LogFile::debugLogging())
        LogFile::printf("Written tag file %s in %d msec", qUtf8Printable(path), mStatistics.writeMs);
    return true;
}

Flush TagFile::flushing()
{
    return sDurability == Durability::PowerLoss ? Flush::Disk : Flush::Process;
}

bool TagFile::close()
{
    if (!mCacheFile.isOpen())
        return false;
    mCacheFile.close();
    return true;
}

bool TagFile::fail(const QString& reason)
{
    mFailure = reason;
    return false;
}

}  // namespace Kdd
