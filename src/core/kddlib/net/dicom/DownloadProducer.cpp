#include "kddlib/net/dicom/DownloadProducer.h"

#include "kddlib/Limits.h"

#include <dcmtk/dcmdata/dcerror.h>

#include <algorithm>
#include <cstring>
#include <utility>

namespace Kdd
{
namespace
{

// The parser asks for a few bytes at a time.
constexpr qint64 kWindow = 64 * 1024;
// For what the parser steps back over.
constexpr qint64 kHistory = 4 * 1024;

makeOFConditionConst(EC_EndOfFile, OFM_dcmdata, 0x310, OF_error, "End-of-file reached on input operation");
makeOFConditionConst(EC_ReadError, OFM_dcmdata, 0x311, OF_error, "Read/write error on IO operation");
makeOFConditionConst(EC_LogicalError, OFM_dcmdata, 0x312, OF_error, "Logical error on IO operation");
makeOFConditionConst(EC_CannotPutBack, OFM_dcmdata, 0x313, OF_error, "putback failed");

}  // namespace

DownloadProducer::DownloadProducer()
    : mStream(nullptr)
    , mStatus(EC_LogicalError)
{
}

DownloadProducer::DownloadProducer(KxCurlDownloadStream&& stream)
    : DownloadProducer()
{
    setStream(std::move(stream));
}

void DownloadProducer::setStream(KxCurlDownloadStream&& stream)
{
    mStream = std::move(stream);
    // A page that tells of an error is no object, be it one that could be parsed.
    mStatus = mStream.httpStatus().ok() ? EC_Normal : EC_ReadError;
    mWindow.clear();
    mWindowStart = 0;
    mPosition = 0;
    mLength = good() ? mStream.contentLength() : 0;
    // Of length 0 is an object that is empty, and one of which the server does not tell.
    if (good() && mLength == 0)
        fetchAll();
}

/// The window becomes the object.
void DownloadProducer::fetchAll()
{
    std::size_t size = 0;
    // Doubled each time, so that little is copied; what a server says without end stops at the bound.
    while (size < static_cast<std::size_t>(kMaxResponseSize)) {
        mWindow.resize(size + std::max<std::size_t>(size, kWindow));
        const qint64 got = fetch(mWindow.data() + size, static_cast<qint64>(mWindow.size() - size));
        size += static_cast<std::size_t>(got);
        if (got == 0)
            break;
    }
    mWindow.resize(size);
    mLength = static_cast<qint64>(size);
    // The parser cannot tell a part from the whole, so a part is given to nobody.
    if (mStream.isOpen() || mStream.httpStatus().failed)
        mStatus = EC_ReadError;
}

qint64 DownloadProducer::fetch(char* to, qint64 count)
{
    const StopwatchSum::Running running(mNetworkTime);
    return mStream.read(to, count).gcount();
}

offile_off_t DownloadProducer::read(void* bytes, offile_off_t count)
{
    auto* to = static_cast<char*>(bytes);
    // Never more than there is: the parser asks for what a length in the data says.
    qint64 left = good() ? std::clamp<qint64>(count, 0, avail()) : 0;
    const qint64 wanted = left;
    while (left > 0) {
        qint64 part = std::min(left, windowEnd() - mPosition);
        if (part > 0)
            std::memcpy(to, mWindow.data() + (mPosition - mWindowStart), static_cast<std::size_t>(part));
        else if (left >= kWindow)
            part = readBeyondWindow(to, left);
        else if (fillWindow())
            continue;
        if (part <= 0)
            break;
        to += part;
        left -= part;
        mPosition += part;
    }
    return wanted - left;
}

/// Moves the window on, with the last of what it held before.
bool DownloadProducer::fillWindow()
{
    keepHistory(mWindow.data(), static_cast<qint64>(mWindow.size()));
    const std::size_t kept = mWindow.size();
    const qint64 wanted = std::min(kWindow, mLength - windowEnd());
    mWindow.resize(kept + static_cast<std::size_t>(wanted));
    const qint64 got = fetch(mWindow.data() + kept, wanted);
    mWindow.resize(kept + static_cast<std::size_t>(got));
    if (got < wanted)
        mStatus = mStream.httpStatus().failed ? EC_ReadError : EC_EndOfFile;
    return got > 0;
}

/// Long values go straight to where they are wanted.
qint64 DownloadProducer::readBeyondWindow(char* to, qint64 count)
{
    const qint64 got = fetch(to, count);
    // These bytes lie behind the window, whose new content is their end.
    mWindowStart = windowEnd();
    keepHistory(to, got);
    if (got < count)
        mStatus = mStream.httpStatus().failed ? EC_ReadError : EC_EndOfFile;
    return got;
}

/// The window becomes the end of these bytes, which begin where it begins.
void DownloadProducer::keepHistory(const char* bytes, qint64 count)
{
    const qint64 dropped = std::max<qint64>(0, count - kHistory);
    mWindow = std::vector<char>(bytes + dropped, bytes + count);
    mWindowStart += dropped;
}

offile_off_t DownloadProducer::skip(offile_off_t count)
{
    // Read away, for a download cannot be moved in.
    char nowhere[4096];
    qint64 skipped = 0;
    while (skipped < count) {
        const qint64 part = read(nowhere, std::min<qint64>(count - skipped, sizeof nowhere));
        if (part <= 0)
            break;
        skipped += part;
    }
    return skipped;
}

void DownloadProducer::putback(offile_off_t count)
{
    if (count > mPosition - mWindowStart)
        mStatus = EC_CannotPutBack;
    else
        mPosition -= count;
}

}  // namespace Kdd
