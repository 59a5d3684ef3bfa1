#include "server/http/OpenFile.h"

#include <QFile>

#include <fcntl.h>
#include <kddlib/SystemResult.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

namespace Kdd::Http
{
namespace
{

QByteArray identityOf(const struct stat& status)
{
    const auto nanoseconds = [](const timespec& time) {
        return QByteArray::number(static_cast<qlonglong>(time.tv_sec)) + '.' +
               QByteArray::number(static_cast<qlonglong>(time.tv_nsec));
    };
    // The time of change too: a writer can set the time of modification back, but not that one.
    return QByteArray::number(static_cast<qulonglong>(status.st_dev)) + '-' +
           QByteArray::number(static_cast<qulonglong>(status.st_ino)) + '-' +
           QByteArray::number(static_cast<qlonglong>(status.st_size)) + '-' + nanoseconds(status.st_mtim) +
           '-' + nanoseconds(status.st_ctim);
}

bool isSame(const timespec& one, const timespec& other)
{
    return one.tv_sec == other.tv_sec && one.tv_nsec == other.tv_nsec;
}

/// File systems tick once in two seconds at the slowest.
constexpr time_t kSettledAge = 3;  // [s]

bool isOlder(const struct stat& status)
{
    timespec now = {};
    return ::clock_gettime(CLOCK_REALTIME, &now) == 0 && now.tv_sec - status.st_mtim.tv_sec >= kSettledAge &&
           now.tv_sec - status.st_ctim.tv_sec >= kSettledAge;
}

}  // namespace

std::shared_ptr<const OpenFile> OpenFile::open(const QByteArray& path, Result& result, Changes changes)
{
    const std::shared_ptr<OpenFile> file(new OpenFile);
    // Not to be blocked by a pipe of that name.
    file->mDescriptor = ::open(path.constData(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
    struct stat& status = file->mStatus;
    if (file->mDescriptor < 0 || ::fstat(file->mDescriptor, &status) != 0) {
        result = Result(SystemResult::of(errno)).within(QFile::decodeName(path));
        return nullptr;
    }
    if (!S_ISREG(status.st_mode)) {
        result = Result::failure(QStringLiteral("no regular file")).within(QFile::decodeName(path));
        return nullptr;
    }
    file->mSize = status.st_size;
    file->mIdentity = identityOf(status);
    file->mIsSettled = isOlder(status);
    file->mChanges = changes;
    result = {};
    return file;
}

OpenFile::~OpenFile()
{
    if (mDescriptor >= 0)
        ::close(mDescriptor);
}

Result OpenFile::checkUnchanged() const
{
    struct stat now = {};
    if (::fstat(mDescriptor, &now) != 0)
        return SystemResult::of(errno);
    // A name that is given or taken is a change too, though not of the content.
    const bool isRenamed = now.st_nlink != mStatus.st_nlink;
    if (now.st_size < mStatus.st_size)
        return Result::failure(QStringLiteral("the file was cut short"));
    if (now.st_size != mStatus.st_size || !isSame(now.st_mtim, mStatus.st_mtim) ||
        (!isRenamed && !isSame(now.st_ctim, mStatus.st_ctim)))
        return Result::failure(QStringLiteral("the file was changed"));
    return {};
}

Result OpenFile::read(qint64 offset, qint64 length, QByteArray& bytes) const
{
    if (offset < 0 || length < 0 || offset > mSize || length > mSize - offset)
        return Result::failure(QStringLiteral("%1 bytes from %2 on are not there").arg(length).arg(offset));
    bytes.resize(static_cast<int>(length));
    qint64 done = 0;
    while (done < length) {
        const ssize_t got =
            ::pread(mDescriptor, bytes.data() + done, static_cast<size_t>(length - done), offset + done);
        if (got < 0 && errno == EINTR)
            continue;
        if (got < 0)
            return SystemResult::of(errno);
        if (got == 0)
            return Result::failure(QStringLiteral("the file was cut short"));
        done += got;
    }
    return refusesChanges() ? checkUnchanged() : Result();
}

}  // namespace Kdd::Http
