#include "kddlib/net/KxCurlDownloadStream.h"

#include "kddlib/net/KxCurlDownloadStreambuf.h"

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
    , mBuffer(std::move(other.mBuffer))
    , mStatus(std::move(other.mStatus))
    , mFailure(std::move(other.mFailure))
{
    // The base hands over its state and leaves the buffer to us.
    set_rdbuf(mBuffer.get());
    other.rdbuf(nullptr);
}

KxCurlDownloadStream& KxCurlDownloadStream::operator=(KxCurlDownloadStream&& other) noexcept
{
    if (this == &other)
        return *this;
    std::istream::operator=(std::move(other));
    mBuffer = std::move(other.mBuffer);
    mStatus = std::move(other.mStatus);
    mFailure = std::move(other.mFailure);
    set_rdbuf(mBuffer.get());
    other.rdbuf(nullptr);
    return *this;
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
    mFailure = failure();
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

std::string KxCurlDownloadStream::failure() const
{
    const KxCurlDownloadRequest* request = mBuffer ? mBuffer->currentRequest() : nullptr;
    return request ? request->failure() : mFailure;
}

}  // namespace Kdd
