#include "kddlib/net/http/KxCurlDownloadStreambuf.h"

#include "kddlib/net/http/HttpAnswer.h"
#include "platform/base/LogFile.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <utility>

namespace Kdd
{
namespace
{

constexpr std::size_t kGetBufferSize = 16 * 1024;

/// Splits what is left into parts of about the length of the first, all equal but for the last.
qint64 spanOf(qint64 remaining, qint64 first)
{
    // To the nearest: no part is longer than one and a half of the first, by which the memory is reckoned.
    const float quotient = static_cast<float>(remaining) / static_cast<float>(first);
    const qint64 parts = std::max<qint64>(1, std::llround(quotient));
    return remaining / parts + (remaining % parts != 0 ? 1 : 0);
}

}  // namespace

KxCurlDownloadStreambuf::KxCurlDownloadStreambuf(KxCurlDownloadRequest::Origin origin,
                                                 std::optional<ByteRange> firstRange, int maxConcurrent)
    : mOrigin(std::move(origin))
    , mMaxConcurrent(static_cast<std::size_t>(std::max(maxConcurrent, 1)))
{
    mRequests.push_back(std::make_unique<KxCurlDownloadRequest>(mOrigin, firstRange));
}

KxCurlDownloadRequest* KxCurlDownloadStreambuf::currentRequest()
{
    if (mRequests.empty())
        return nullptr;
    KxCurlDownloadRequest& front = *mRequests.front();
    // It stays in front: nothing may be delivered behind a gap.
    if (front.status().failed)
        return &front;
    // A request may fail to be made, for want of memory or of a token. To the reader that is a transfer that broke
    // off, for he may be inside a stream that throws nothing.
    try {
        if (front.needsWholeObject())
            fetchWhole();
        else if (!mPlanned && front.range() && front.part())
            plan(*front.part());
        if (mPlanned && front.isDone() && !front.hasUnread())
            advance();
    } catch (const std::exception& fault) {
        front.fail(fault.what());
    }
    return mRequests.front().get();
}

void KxCurlDownloadStreambuf::fetchWhole()
{
    // A new request without range; the one that it replaces has delivered nothing.
    mRequests.front() = std::make_unique<KxCurlDownloadRequest>(mOrigin, std::nullopt);
}

/// Once, when the first answer has told the length and the version of the object.
void KxCurlDownloadStreambuf::plan(const ContentRange& first)
{
    mPlanned = true;
    mVersion = ObjectVersion::of(mRequests.front()->status());
    mTotal = first.total;
    mNext = first.range.last + 1;
    if (mNext < mTotal)
        mSpan = spanOf(mTotal - mNext, first.range.length());
    while (mRequests.size() < mMaxConcurrent && mNext < mTotal)
        mRequests.push_back(nextRequest());
}

/// The front has been read to its end.
void KxCurlDownloadStreambuf::advance()
{
    if (mNext < mTotal)
        mRequests.push_back(nextRequest());
    // The last one stays: its status is that of the download.
    if (mRequests.size() < 2)
        return;
    // For whoever asks while the next one has no answer yet.
    mFinished = mRequests.front()->status();
    mRequests.pop_front();
}

KxCurlDownloadStreambuf::Request KxCurlDownloadStreambuf::nextRequest()
{
    const ByteRange range{mNext, mNext + std::min(mSpan, mTotal - mNext) - 1};
    auto request = std::make_unique<KxCurlDownloadRequest>(mOrigin, range,
                                                           KxCurlDownloadRequest::Expected{mTotal, mVersion});
    mNext = range.last + 1;
    return request;
}

KxCurlDownloadStreambuf::int_type KxCurlDownloadStreambuf::underflow()
{
    mGetBuffer.resize(kGetBufferSize);
    const std::streamsize count = fetch(mGetBuffer.data(), kGetBufferSize);
    setg(mGetBuffer.data(), mGetBuffer.data(), mGetBuffer.data() + count);
    return count > 0 ? traits_type::to_int_type(*gptr()) : traits_type::eof();
}

std::streamsize KxCurlDownloadStreambuf::xsgetn(char* to, std::streamsize count)
{
    std::streamsize got = std::min<std::streamsize>(count, egptr() - gptr());
    if (got > 0)
        std::memcpy(to, gptr(), static_cast<std::size_t>(got));
    gbump(static_cast<int>(got));
    // Straight into the caller's memory: long reads are not copied twice.
    while (got < count) {
        const std::streamsize more = fetch(to + got, count - got);
        if (more == 0)
            break;
        got += more;
    }
    return got;
}

/// At least one byte unless the download is at its end; no more than one request holds.
std::streamsize KxCurlDownloadStreambuf::fetch(char* to, std::streamsize count)
{
    while (isOpen()) {
        // Nothing means that this request is at its end, whereupon the next is in front or none is open.
        const std::size_t got = mRequests.front()->read(to, static_cast<std::size_t>(count));
        if (got > 0)
            return static_cast<std::streamsize>(got);
    }
    return 0;
}

bool KxCurlDownloadStreambuf::isOpen()
{
    const KxCurlDownloadRequest* request = currentRequest();
    return request && (request->hasUnread() || !(request->isDone() || request->status().failed));
}

void KxCurlDownloadStreambuf::close()
{
    mRequests.clear();
    setg(nullptr, nullptr, nullptr);
}

const KxHttpStatus* KxCurlDownloadStreambuf::status()
{
    const KxCurlDownloadRequest* request = currentRequest();
    if (!request)
        return nullptr;
    const bool isAnswered = request->status().code != 0 || request->status().failed;
    return isAnswered ? &request->status() : &mFinished;
}

qint64 KxCurlDownloadStreambuf::contentLength()
{
    if (mContentLength < 0)
        mContentLength = findContentLength();
    return mContentLength;
}

qint64 KxCurlDownloadStreambuf::findContentLength()
{
    const KxCurlDownloadRequest* request = currentRequest();
    if (!request) {
        LogFile::warnf("Could not get content length. No request object.");
        return 0;
    }
    // Of later ranges the answer may not be in yet, and all of them have the total of the first.
    return mPlanned ? mTotal : objectLengthOf(request->status());
}

}  // namespace Kdd
