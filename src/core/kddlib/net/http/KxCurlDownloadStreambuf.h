#pragma once

#include "kddlib/net/http/KxCurlDownloadRequest.h"

#include <deque>
#include <memory>
#include <streambuf>
#include <string>
#include <vector>

namespace Kdd
{

/// Fetches an object for a stream: in one request, or range by range with several requests at a time, of which the
/// reader always gets the lowest. While he does the others keep arriving.
///
/// Memory: what arrives ahead of the reader is kept, at most a whole range for each request. As follow-up ranges are
/// up to half as long again as the first, that is less than 1.5 x first range x number of requests, and 1 MiB for a
/// request without a range; beside it 256 KiB for each request's receive buffer.
class KxCurlDownloadStreambuf : public std::streambuf
{
public:
    /// Begins with the first range when one is given, else with the whole. CurlError and std::runtime_error when the
    /// request cannot be set up.
    KxCurlDownloadStreambuf(KxCurlDownloadRequest::Origin origin, std::optional<ByteRange> firstRange,
                            int maxConcurrent);

    int_type underflow() override;
    std::streamsize xsgetn(char* to, std::streamsize count) override;

    /// Whether there may be more to read.
    virtual bool isOpen();

    /// Breaks all requests off.
    virtual void close();

    /// The request whose bytes come next; null once closed. Here ranges are planned, and finished ones replaced.
    virtual KxCurlDownloadRequest* currentRequest();

    /// Of the current request; while that has no answer, of the one before it. Null once closed. Valid until the next
    /// call of anything.
    const KxHttpStatus* status();

    /// The length of the whole object [bytes]; 0 when the server does not tell, which is logged once.
    qint64 contentLength();

private:
    using Request = std::unique_ptr<KxCurlDownloadRequest>;

    void plan(const ContentRange& first);
    void advance();
    void fetchWhole();
    Request nextRequest();
    std::streamsize fetch(char* to, std::streamsize count);
    qint64 findContentLength();

    KxCurlDownloadRequest::Origin mOrigin;
    std::size_t mMaxConcurrent;
    qint64 mSpan = 1024 * 1024;  // of a follow-up range [bytes]
    std::vector<char> mGetBuffer;
    bool mPlanned = false;
    std::deque<Request> mRequests;  // in the order of the object
    KxHttpStatus mFinished;         // of the last request that was read to its end
    qint64 mNext = 0;               // first byte that no request has been made for
    qint64 mTotal = 0;
    ObjectVersion mVersion;
    qint64 mContentLength = -1;
};

}  // namespace Kdd
