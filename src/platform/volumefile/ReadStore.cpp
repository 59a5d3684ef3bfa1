#include "platform/volumefile/ReadStore.h"

#include <cstring>
#include <utility>

namespace Kdd::VolumeFile
{

bool ReadStore::write(qint64 /*at*/, const void* /*bytes*/, std::size_t /*size*/)
{
    return false;
}

bool ReadStore::truncate(qint64 /*size*/)
{
    return false;
}

Result FileToRead::open(const QByteArray& path)
{
    return mFile.open(path.constData());
}

bool FileToRead::read(qint64 at, void* bytes, std::size_t size)
{
    // Divided into two questions, because place and size are claims of the file and their sum could wrap.
    if (at < 0 || at > mFile.size() || size > static_cast<std::size_t>(mFile.size() - at))
        return false;
    const auto count = static_cast<qint64>(size);
    return mFile.readAt(at, bytes, count) == count;
}

BytesToRead::BytesToRead(QByteArray bytes)
    : mBytes(std::move(bytes))
{
}

bool BytesToRead::read(qint64 at, void* bytes, std::size_t size)
{
    if (at < 0 || at > mBytes.size() || size > static_cast<std::size_t>(mBytes.size() - at))
        return false;
    std::memcpy(bytes, mBytes.constData() + at, size);
    return true;
}

}  // namespace Kdd::VolumeFile
