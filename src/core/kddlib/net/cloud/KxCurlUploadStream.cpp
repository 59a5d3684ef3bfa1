#include "kddlib/net/cloud/KxCurlUploadStream.h"

#include "kddlib/net/cloud/KxCurlUploadStreambuf.h"

#include <utility>

namespace Kdd
{

KxCurlUploadStream::KxCurlUploadStream(std::unique_ptr<KxCurlUploadStreambuf> buffer)
    : std::ostream(nullptr)
    , mBuffer(std::move(buffer))
{
    rdbuf(mBuffer.get());
}

KxCurlUploadStream::~KxCurlUploadStream()
{
    closeSilently();
}

KxCurlUploadStream::KxCurlUploadStream(KxCurlUploadStream&& other) noexcept
    : std::ostream(std::move(other))
{
    takeBuffer(other);
}

KxCurlUploadStream& KxCurlUploadStream::operator=(KxCurlUploadStream&& other) noexcept
{
    if (this == &other)
        return *this;
    // What was written before becomes an object, as it would by the end of the stream.
    closeSilently();
    std::ostream::operator=(std::move(other));
    takeBuffer(other);
    return *this;
}

bool KxCurlUploadStream::isOpen() const
{
    return mBuffer && mBuffer->isOpen();
}

void KxCurlUploadStream::close()
{
    if (isOpen() && !mBuffer->close())
        setstate(failbit);
}

void KxCurlUploadStream::abandon()
{
    if (mBuffer)
        mBuffer->abandon();
}

std::string KxCurlUploadStream::error() const
{
    return mBuffer ? mBuffer->error() : std::string();
}

void KxCurlUploadStream::leaveErrorsToCaller()
{
    if (mBuffer)
        mBuffer->leaveErrorsToCaller();
}

void KxCurlUploadStream::closeSilently() noexcept
{
    // A destructor must not throw, whatever the caller wants of his writes.
    exceptions(goodbit);
    close();
}

/// The standard move takes the state along but leaves the other stream its buffer, which now is ours.
void KxCurlUploadStream::takeBuffer(KxCurlUploadStream& other)
{
    mBuffer = std::move(other.mBuffer);
    set_rdbuf(mBuffer.get());
    other.exceptions(goodbit);
    other.rdbuf(nullptr);
}

}  // namespace Kdd
