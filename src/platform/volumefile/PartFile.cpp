#include "platform/volumefile/PartFile.h"

#include "platform/os/SystemResult.h"

#include <QRandomGenerator>

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <utility>

namespace Kdd::VolumeFile
{

PartFile::~PartFile()
{
    if (mDescriptor >= 0)
        ::close(mDescriptor);
    if (!mPath.isEmpty())
        ::unlink(mPath.constData());
}

Result PartFile::create(const QByteArray& target)
{
    // A random part of the name: several processes may write the same target, and what a killed one left is
    // in nobody's way.
    const QByteArray passing = QByteArray::number(QRandomGenerator::global()->generate64(), 16);
    const QByteArray path = target + '.' + passing + ".part";
    mDescriptor = ::open(path.constData(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, 0666);
    if (mDescriptor < 0)
        return Result(SystemResult::of(errno)).within(QStringLiteral("cannot be made"));
    mTarget = target;
    mPath = path;
    return {};
}

void PartFile::fail(int error)
{
    if (mError == 0)
        mError = error;
}

bool PartFile::write(qint64 at, const void* bytes, std::size_t size)
{
    const auto* from = static_cast<const char*>(bytes);
    // The size grows also after an error, since the library is told that all is well.
    mSize = std::max(mSize, at + static_cast<qint64>(size));
    while (size > 0 && mError == 0) {
        const ssize_t written = ::pwrite(mDescriptor, from, size, at);
        if (written < 0 && errno == EINTR)
            continue;
        if (written <= 0) {
            fail(written < 0 ? errno : EIO);
            break;
        }
        from += written;
        at += written;
        size -= static_cast<std::size_t>(written);
    }
    return true;
}

bool PartFile::truncate(qint64 size)
{
    mSize = size;
    if (mError == 0 && ::ftruncate(mDescriptor, size) != 0)
        fail(errno);
    return true;
}

bool PartFile::read(qint64 at, void* bytes, std::size_t size)
{
    auto* to = static_cast<char*>(bytes);
    while (size > 0 && mError == 0) {
        const ssize_t got = ::pread(mDescriptor, to, size, at);
        if (got < 0 && errno == EINTR)
            continue;
        if (got < 0)
            fail(errno);
        if (got <= 0)
            break;
        to += got;
        at += got;
        size -= static_cast<std::size_t>(got);
    }
    // The library may read what it has given out and never written.
    std::memset(to, 0, size);
    return true;
}

Result PartFile::state() const
{
    return mError == 0 ? Result()
                       : Result(SystemResult::of(mError)).within(QStringLiteral("cannot be written"));
}

Result PartFile::publish()
{
    // Not flushed to disk: a volume can be made again from its images, and one that a power loss has torn is known by
    // its checksums. Whoever promises more flushes what has its name.
    // Network file systems keep errors back until then.
    if (::close(std::exchange(mDescriptor, -1)) != 0)
        fail(errno);
    if (mError != 0)
        return state();
    // From here on readers find it, and it takes the place of a file that had the name.
    if (std::rename(mPath.constData(), mTarget.constData()) != 0)
        return Result(SystemResult::of(errno)).within(QStringLiteral("cannot be named"));
    mPath.clear();
    return {};
}

}  // namespace Kdd::VolumeFile
