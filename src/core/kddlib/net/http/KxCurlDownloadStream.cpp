#include "kddlib/net/http/KxCurlDownloadStream.h"

#include "kddlib/net/http/KxCurlDownloadStreambuf.h"

#include <utility>

namespace Kdd
{

KxCurlDownloadStream::KxCurlDownloadStream(KxCurlDownloadStreambuf* buffer)
    : std::istream(buffer)
    , mBuffer(buffer)
{
}

KxCurlDownloadStream::~KxCurlDownloadStream() = default;

KxCurlDownloadStream::KxCurlDownloadStream(KxCurlDownloadStream&& other) noexcept
    : std::istream(std::move(other))
{
    takeBuffer(other);
}

KxCurlDownloadStream& KxCurlDownloadStream::operator=(KxCurlDownloadStream&& other) noexcept
{
    if (this == &other)
        return *this;
    std::istream::operator=(std::move(other));
    takeBuffer(other);
    return *this;
}

/// The standard move takes the state along but leaves the other stream its buffer, which now is ours.
void KxCurlDownloadStream::takeBuffer(KxCurlDownloadStream& other)
{
    mBuffer = std::move(other.mBuffer);
    mStatus = std::move(other.mStatus);
    set_rdbuf(mBuffer.get());
    other.exceptions(goodbit);
    other.rdbuf(nullptr);
}

bool KxCurlDownloadStream::isOpen() const
{
    return mBuffer && mBuffer->isOpen();
}

void KxCurlDownloadStream::close()
{
    if (!mBuffer)
        return;
    httpStatus();
    // The status was copied just before, for the requests that have it go now.
    mBuffer->close();
}

qint64 KxCurlDownloadStream::contentLength() const
{
    return mBuffer ? mBuffer->contentLength() : 0;
}

const KxHttpStatus& KxCurlDownloadStream::httpStatus()
{
    if (!mBuffer)
        return KxHttpStatus::empty();
    if (const KxHttpStatus* status = mBuffer->status())
        mStatus = *status;
    return mStatus;
}

}  // namespace Kdd
