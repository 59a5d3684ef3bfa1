#include "kddlib/net/cloud/KxCurlUploadSession.h"

#include "kddlib/net/cloud/UploadErrors.h"
#include "kddlib/net/http/KxCurlRequest.h"
#include "kddlib/net/http/PreparedRequest.h"
#include "kddlib/net/http/WebOrigin.h"
#include "platform/base/LogFile.h"
#include "platform/resources/ExResource.h"

#include <algorithm>
#include <charconv>
#include <string_view>
#include <utility>

namespace Kdd
{
namespace
{

constexpr int kOk = 200;
constexpr int kCreated = 201;
constexpr int kResumeIncomplete = 308;

// Programs look for this text, also for a session that could not be opened.
constexpr char kChunkExhausted[] = "Retry policy exhausted in KxCurlUploadSession::uploadChunk().";

/// Chunks that the storage takes in part are gone on with at once. In steps of 256 KiB this suffices for 16 MiB; a
/// storage that takes less at a time is treated like one that takes nothing.
constexpr int kMaxShortWrites = 64;

bool isUnrecoverable(int code)
{
    const int codes[] = {400, 401, 403, 404, 405, 409, 411, 412, 416};
    return std::find(std::begin(codes), std::end(codes), code) != std::end(codes);
}

std::string contentLength(int length)
{
    return "Content-Length: " + std::to_string(length);
}

}  // namespace

KxCurlUploadSession::KxCurlUploadSession(std::shared_ptr<KxCurlHandleFactory> factory, const CurlShare& share,
                                         UploadTarget target, Sleep sleep)
    : mFactory(std::move(factory))
    , mShare(share)
    , mTarget(std::move(target))
    , mSleep(std::move(sleep))
{
    start();
}

void KxCurlUploadSession::start()
{
    RetryPolicy policy;
    while (!policy.exhausted()) {
        mSessionUrl.clear();
        try {
            const int code = exchange(
                "POST", mTarget.url,
                {contentLength(0), "x-goog-resumable: start", "Content-Type: " + mTarget.contentType});
            if (code == kCreated && mSessionUrl.empty())
                throw UnrecoverableResponseError("The cloud storage does not name the upload session");
            if (code == kCreated)
                return;
            takeCode(code, "starting");
        } catch (const CurlError& error) {
            note(error, LogFile::Severity::Warning, "Curl error while starting resumable upload: ");
        }
        pause(policy);
    }
    throw RetryPolicyExhaustedError(kChunkExhausted, mLastFault);
}

void KxCurlUploadSession::uploadChunk(const QByteArray& data, Chunk kind)
{
    mChecksums.add(data);
    const quint64 end = mChecksums.length();
    if (kind == Chunk::Last)
        mTotal = end;
    const auto isDone = [&] { return mTotal ? mIsComplete : mNextOffset == end; };

    RetryPolicy policy;
    int shortWrites = 0;
    while (!isDone()) {
        if (policy.exhausted())
            throw RetryPolicyExhaustedError(kChunkExhausted, mLastFault);
        // What the storage has of the chunk is skipped; the rest is sent from where it lies.
        const quint64 before = mNextOffset;
        const auto left = static_cast<int>(end - before);
        const QByteArray rest = QByteArray::fromRawData(data.constData() + data.size() - left, left);
        const Attempt attempt = tryChunk(rest, kind);
        const bool isShortWrite = mNextOffset > before && ++shortWrites <= kMaxShortWrites;
        if (isDone() || (attempt == Attempt::Answered && isShortWrite))
            continue;
        pause(policy);
        if (attempt == Attempt::Failed || !policy.exhausted())
            reset(policy);
    }
}

KxCurlUploadSession::Attempt KxCurlUploadSession::tryChunk(const QByteArray& rest, Chunk kind)
{
    const quint64 start = mNextOffset;
    const quint64 end = start + static_cast<quint64>(rest.size());
    std::string range = "Content-Range: bytes ";
    range += rest.isEmpty() ? "*" : std::to_string(start) + '-' + std::to_string(end - 1);
    range += '/' + (kind == Chunk::Last ? std::to_string(end) : std::string("*"));
    mSentEnd = std::max(mSentEnd, end);
    try {
        const int code = exchange("PUT", mSessionUrl, {contentLength(rest.size()), range}, rest);
        if (code != kResumeIncomplete && !mIsComplete)
            takeCode(code, "continuing");
    } catch (const CurlError& error) {
        note(error, LogFile::Severity::Error, "Recevied curl error: ");
        return Attempt::Failed;
    }
    if (!mIsComplete && mNextOffset != end)
        LogFile::warnf("Short write to Google Cloud Storage.\nContent length: %zu\nActually written: %zu",
                       static_cast<std::size_t>(rest.size()), static_cast<std::size_t>(mNextOffset - start));
    return Attempt::Answered;
}

/// Only an answer about the upload tells where it stands. After any other the chunk would be sent to a place where the
/// storage may no longer be.
void KxCurlUploadSession::reset(RetryPolicy& policy)
{
    while (!policy.exhausted()) {
        try {
            const int code = exchange("PUT", mSessionUrl, {contentLength(0), "Content-Range: bytes */*"});
            if (code == kResumeIncomplete || mIsComplete)
                return;
            takeCode(code, "resetting");
        } catch (const CurlError& error) {
            note(error, LogFile::Severity::Warning, "Curl error while resetting resumable upload: ");
        }
        pause(policy);
    }
    throw RetryPolicyExhaustedError("Retry policy exhausted in KxCurlUploadSession::resetSession().",
                                    mLastFault);
}

/// A transfer that did not come through.
void KxCurlUploadSession::note(const CurlError& error, LogFile::Severity severity, const char* what)
{
    LogFile::write(severity, what + textForLog(error));
    mLastFault = error.what();
    // It becomes part of a message of one line.
    std::replace(mLastFault.begin(), mLastFault.end(), '\n', ' ');
}

/// An answer that brings the step no further.
void KxCurlUploadSession::takeCode(int code, const char* step)
{
    mLastFault = "HTTP code " + std::to_string(code);
    LogFile::warnf("HTTP code %d while %s resumable upload", code, step);
}

void KxCurlUploadSession::pause(RetryPolicy& policy) const
{
    const std::chrono::milliseconds delay = policy.nextDelay();
    if (delay.count() > 0)
        mSleep(delay);
}

int KxCurlUploadSession::exchange(const std::string& method, const std::string& url,
                                  const std::vector<std::string>& headers, const QByteArray& body)
{
    KxCurlRequest request(mFactory, mShare, url, method);
    for (const std::string& line : headers)
        request.addHeader(line);
    for (const std::string& line : storageHeaders(url))
        request.addHeader(line);
    if (body.isEmpty()) {
        request.perform();
    } else {
        // Else curl would call the bytes a form, and wait for the server's leave to send them.
        request.addHeader("Content-Type: ");
        request.addHeader("Expect: ");
        request.perform(body);
    }
    take(request);
    return request.status().code;
}

/// The session may live on another host, and to that one the authorisation is nobody's business: whoever holds it may
/// do what the account may do. The session's own address is leave enough to upload.
std::vector<std::string> KxCurlUploadSession::storageHeaders(const std::string& url) const
{
    const WebOrigin origin = originOf(url);
    const bool isOwn =
        origin == originOf(mTarget.url) || origin == originOf(ExResource::cloudApiEndpoint().toStdString());
    if (!isOwn)
        return {"Cache-Control: no-transform"};
    const std::string authorization = mTarget.authorization ? mTarget.authorization() : std::string();
    // Without it the storage would refuse for good what may be told to it a little later.
    if (mTarget.authorization && authorization.empty())
        throw CurlError(CURLE_LOGIN_DENIED, "There is no access token");
    std::vector<std::string> lines = cloudHeaders(authorization);
    lines.erase(std::remove(lines.begin(), lines.end(), std::string()), lines.end());
    return lines;
}

void KxCurlUploadSession::take(const KxCurlRequest& request)
{
    const KxHttpStatus& status = request.status();
    const bool isOpen = !mSessionUrl.empty();
    if (isOpen && (status.code == kOk || status.code == kCreated)) {
        takeEnd(request);
        return;
    }
    if (isUnrecoverable(status.code))
        throw UnrecoverableResponseError(
            "HTTP code " + std::to_string(status.code) +
            "indicates that this upload session failed and can not be recovered from.");
    if (const auto location = status.headers.find("location"); location != status.headers.end())
        takeLocation(location->second);
    if (const auto range = status.headers.find("range"); range != status.headers.end())
        takeRange(range->second);
}

void KxCurlUploadSession::takeLocation(const std::string& location)
{
    const std::string& base = mSessionUrl.empty() ? mTarget.url : mSessionUrl;
    const std::string url = resolvedUrl(base, location);
    const WebOrigin origin = originOf(url);
    if (!origin.isValid() || (origin.scheme == "http" && originOf(mTarget.url).scheme == "https"))
        throw UnrecoverableResponseError("The cloud storage names \"" + location +
                                         "\" as the upload session, where nothing can be sent in safety");
    mSessionUrl = url;
}

void KxCurlUploadSession::takeRange(const std::string& range)
{
    constexpr std::string_view kStart = "bytes=0-";
    if (range.compare(0, kStart.size(), kStart) != 0)
        return;
    quint64 last = 0;
    const char* const textEnd = range.data() + range.size();
    const auto [numberEnd, error] = std::from_chars(range.data() + kStart.size(), textEnd, last);
    const bool isNumber = error == std::errc() && numberEnd == textEnd;
    if (!isNumber || last >= mSentEnd || last + 1 < mNextOffset)
        throw UnrecoverableResponseError("The cloud storage claims to have \"" + range + "\" after " +
                                         std::to_string(mNextOffset) + " bytes were stored and " +
                                         std::to_string(mSentEnd) + " sent");
    mNextOffset = last + 1;
}

void KxCurlUploadSession::takeEnd(const KxCurlRequest& request)
{
    if (!mTotal || mSentEnd < *mTotal)
        throw UnrecoverableResponseError(
            "The cloud storage ended the upload before the last bytes were sent");
    const std::string difference = mChecksums.difference(request.status(), request.response());
    if (!difference.empty())
        throw UnrecoverableResponseError("The object in the cloud storage is not what was sent: " +
                                         difference);
    mNextOffset = *mTotal;
    mIsComplete = true;
}

}  // namespace Kdd
