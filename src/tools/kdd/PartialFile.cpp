#include "tools/kdd/PartialFile.h"

#include <QJsonDocument>
#include <QJsonObject>
#include <QSaveFile>

#include <fcntl.h>
#include <kddlib/ExclusiveFile.h>
#include <kddlib/LogFile.h>
#include <kddlib/PathName.h>
#include <kddlib/SystemResult.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

namespace Kdd
{

namespace
{

const QString kUrl = QStringLiteral("url");
const QString kEntityTag = QStringLiteral("etag");
const QString kGeneration = QStringLiteral("generation");
const QString kLastModified = QStringLiteral("lastModified");
const QString kLength = QStringLiteral("length");
const QString kBoot = QStringLiteral("boot");

// Records are far shorter; no more is read of what may be a foreign file.
constexpr qint64 kLongestRecord = 64 * 1024;  // [bytes]

/// Another one after each start of the machine.
QString bootId()
{
    QFile file(QStringLiteral("/proc/sys/kernel/random/boot_id"));
    return file.open(QIODevice::ReadOnly) ? QString::fromLatin1(file.readAll().trimmed()) : QString();
}

QString text(const std::string& bytes)
{
    return QString::fromStdString(bytes);
}

std::string bytes(const QJsonValue& value)
{
    return value.toString().toStdString();
}

/// 0, or the errno.
int flushFolderOf(const QByteArray& path)
{
    const int slash = path.lastIndexOf('/');
    const QByteArray folder = slash < 0 ? QByteArray(".") : path.left(qMax(1, slash));
    const int descriptor = ::open(folder.constData(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (descriptor < 0)
        return errno;
    // EINVAL: a file system that knows no flushing of folders, so nothing is left to do.
    const int error = ::fsync(descriptor) == 0 || errno == EINVAL ? 0 : errno;
    ::close(descriptor);
    return error;
}

}  // namespace

PartialFile::PartialFile(QString target)
    : mTarget(std::move(target))
{
}

bool PartialFile::refuse(const char* action, const QString& reason) const
{
    LogFile::errorf("%s %s: %s", qUtf8Printable(path()), action, qUtf8Printable(reason));
    return false;
}

bool PartialFile::open()
{
    const LockedOpenResult result =
        // One attempt, because whoever holds the part does so until his transfer ends.
        openLockedFile(mFile, path(), FileLock::Exclusive, IfAbsent::Create, LockPolling{1, 0});
    if (result)
        return true;
    if (result.failure == OpenFailure::Locked)
        return refuse("cannot be opened", QStringLiteral("another process is fetching it"));
    return refuse("cannot be opened", QString::fromLocal8Bit(std::strerror(result.systemError)));
}

PartialFile::Origin PartialFile::origin() const
{
    QFile record(recordPath());
    if (!record.open(QIODevice::ReadOnly))
        return {};
    const QJsonObject object = QJsonDocument::fromJson(record.read(kLongestRecord)).object();
    // The machine has been started anew: the length may be right while bytes in the middle never reached the
    // disk.
    if (object[kBoot].toString() != bootId())
        return {};
    return {object[kUrl].toString().toUtf8(),
            {bytes(object[kEntityTag]), bytes(object[kGeneration]), bytes(object[kLastModified])},
            object[kLength].toString().toLongLong()};
}

bool PartialFile::startOver(const Origin& origin)
{
    // In this order, so that at no moment the record tells of other bytes than those that are there.
    QFile::remove(recordPath());
    if (!mFile.resize(0) || !mFile.seek(0))
        return refuse("cannot be emptied", mFile.errorString());
    // A part of unknown origin cannot be continued, so it gets no record.
    if (!origin.isRecognisable())
        return true;
    // The length as a text, for a number of JSON is a real.
    const QJsonObject object{
        {kUrl, QString::fromUtf8(origin.url)},          {kEntityTag, text(origin.version.entityTag)},
        {kGeneration, text(origin.version.generation)}, {kLastModified, text(origin.version.lastModified)},
        {kLength, QString::number(origin.length)},      {kBoot, bootId()}};
    // It takes its place as a whole, so half a record is never read.
    QSaveFile record(recordPath());
    if (record.open(QIODevice::WriteOnly) && record.write(QJsonDocument(object).toJson()) > 0 &&
        record.commit())
        return true;
    return refuse("cannot be described", record.errorString());
}

bool PartialFile::goToEnd()
{
    return mFile.seek(mFile.size()) || refuse("cannot be continued", mFile.errorString());
}

/// Without Qt's buffer: the parts are large already.
bool PartialFile::append(const char* bytes, qint64 count)
{
    while (count > 0) {
        const ssize_t written = ::write(mFile.handle(), bytes, static_cast<std::size_t>(count));
        if (written < 0 && errno == EINTR)
            continue;
        // Nothing written is no error of the system, and would go on for ever.
        if (written <= 0)
            return refuse("cannot be written", SystemResult::textOf(written < 0 ? errno : EIO));
        bytes += written;
        count -= written;
    }
    return true;
}

bool PartialFile::publish(bool flush)
{
    // First the bytes, so that what has the name is complete also after a loss of power.
    const bool isOnDisk = !flush || ::fsync(mFile.handle()) == 0;
    if (!isOnDisk || std::rename(pathBytes(path()).constData(), pathBytes(mTarget).constData()) != 0)
        return refuse("cannot be given its name", SystemResult::textOf(errno));
    if (const int error = flush ? flushFolderOf(pathBytes(mTarget)) : 0)
        LogFile::warnf("%s has its name, which a loss of power may take again: %s", qUtf8Printable(mTarget),
                       qUtf8Printable(SystemResult::textOf(error)));
    // Left behind by a crash it tells of a part that is not there, and nothing is continued without bytes.
    QFile::remove(recordPath());
    return true;
}

void PartialFile::removeIfEmpty()
{
    // Still under the lock, so nobody else is fetching into it.
    if (mFile.isOpen() && mFile.size() == 0) {
        QFile::remove(recordPath());
        QFile::remove(path());
    }
}

}  // namespace Kdd
