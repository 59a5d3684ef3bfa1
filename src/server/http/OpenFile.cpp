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

}  // namespace

std::shared_ptr<const OpenFile> OpenFile::open(const QByteArray& path, Result& result)
{
    const std::shared_ptr<OpenFile> file(new OpenFile);
    // Not to be blocked by a pipe of that name.
    file->mDescriptor = ::open(path.constData(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
    struct stat status = {};
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
    result = {};
    return file;
}

OpenFile::~OpenFile()
{
    if (mDescriptor >= 0)
        ::close(mDescriptor);
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
            return Result::failure(QStringLiteral("it was cut short"));
        done += got;
    }
    return {};
}

}  // namespace Kdd::Http
