#include "kddlib/net/BufferedFileProducer.h"

#include <dcmtk/dcmdata/dcerror.h>

#include <cstring>

namespace Kdd
{

namespace
{

/// Most headers fit into it whole.
constexpr qint64 kWindow = 16 * 1024;

}  // namespace

BufferedFileProducer::BufferedFileProducer(const char* path)
    : mWindow(std::make_unique<char[]>(kWindow))
{
    if (const int error = mFile.open(path))
        mStatus = makeOFCondition(OFM_dcmdata, 18, OF_error, std::strerror(error));
}

/// Moves the window so that it begins at the position.
bool BufferedFileProducer::fillWindow()
{
    mWindowStart = mPosition;
    mWindowSize = mFile.readAt(mPosition, mWindow.get(), kWindow);
    if (mWindowSize > 0)
        return true;
    mWindowSize = 0;
    mStatus = EC_InvalidStream;
    return false;
}

offile_off_t BufferedFileProducer::read(void* bytes, offile_off_t count)
{
    auto* to = static_cast<char*>(bytes);
    qint64 left = good() ? qMin<qint64>(count, avail()) : 0;
    const qint64 wanted = left;
    while (left > 0) {
        const bool isInWindow = mPosition >= mWindowStart && mPosition < mWindowStart + mWindowSize;
        if (!isInWindow && !fillWindow())
            break;
        const qint64 offset = mPosition - mWindowStart;
        const qint64 part = qMin(left, mWindowSize - offset);
        std::memcpy(to, mWindow.get() + offset, static_cast<std::size_t>(part));
        to += part;
        mPosition += part;
        left -= part;
    }
    return wanted - left;
}

offile_off_t BufferedFileProducer::skip(offile_off_t count)
{
    const qint64 skipped = good() ? qMax<qint64>(0, qMin<qint64>(count, avail())) : 0;
    mPosition += skipped;
    return skipped;
}

void BufferedFileProducer::putback(offile_off_t count)
{
    if (count > mPosition)
        mStatus = EC_PutbackFailed;
    else
        mPosition -= count;
}

}  // namespace Kdd
