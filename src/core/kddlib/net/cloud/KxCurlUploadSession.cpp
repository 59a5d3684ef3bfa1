#include "kddlib/net/cloud/KxCurlUploadSession.h"

#include "kddlib/net/cloud/CloudAddress.h"
#include "kddlib/net/cloud/UploadErrors.h"
#include "kddlib/net/http/HttpAnswer.h"
#include "kddlib/net/http/KxCurlRequest.h"
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

// Programs look for this text, also for a session that could not be opened.
constexpr char kChunkExhausted[] = "Retry policy exhausted in KxCurlUploadSession::uploadChunk().";
constexpr char kResetExhausted[] = "Retry policy exhausted in KxCurlUploadSession::resetSession().";

/// Chunks that the storage takes in part are gone on with at once. In steps of 256 KiB this suffices for 16 MiB; a
/// storage that takes less at a time is treated like one that takes nothing.
constexpr int kMaxShortWrites = 64;

bool isUnrecoverable(int code)
{
    const int codes[] = {400, 401, 403, 404, 405, 409, 411, 412, 416};
    return std::find(std::begin(codes), std::end(codes), code) != std::end(codes);
}

std::string codeText(int code)
{
    return "HTTP code " + std::to_string(code);
}

std::string contentLength(int length)
{
    return "Content-Length: " + std::to_string(length);
}

}  // namespace

/// How the log tells of a step that has to be tried again.
struct UploadStep
{
    const char* name;
    LogFile::Severity severity;  // of a transfer that did not come through
    const char* faultText;
};

namespace
{

constexpr UploadStep kStart = {"starting", LogFile::Severity::Warning,
                               "Curl error while starting resumable upload: "};
constexpr UploadStep kChunk = {"continuing", LogFile::Severity::Error,
                               "Recevied curl error: "};  // spelt as programs know it
constexpr UploadStep kReset = {"resetting", LogFile::Severity::Warning,
                               "Curl error while resetting resumable upload: "};

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

bool KxCurlUploadSession::repeat(RetryPolicy& policy, const UploadStep& step, const Attempt& attempt)
{
    while (!policy.exhausted()) {
        try {
            if (attempt())
                return true;
        } catch (const CurlError& error) {
            note(error, step);
        }
        if (const std::chrono::milliseconds delay = policy.nextDelay(); delay.count() > 0)
            mSleep(delay);
    }
    return false;
}

void KxCurlUploadSession::start()
{
    RetryPolicy policy;
    const bool isOpen = repeat(policy, kStart, [this] {
        // What an earlier attempt was told is not the session of this one.
        mSessionUrl.clear();
        const int code =
            exchange("POST", mTarget.url,
                     {contentLength(0), "x-goog-resumable: start", "Content-Type: " + mTarget.contentType});
        if (code == kCreated && mSessionUrl.empty())
            throw UnrecoverableResponseError("The cloud storage does not name the upload session");
        return code == kCreated || isInVain(code, kStart);
    });
    if (!isOpen)
        throw RetryPolicyExhaustedError(kChunkExhausted, mLastFault);
}

/// The chunk counts in the checksums once, however often it is sent. Each attempt after the first begins by
/// asking how far the storage has come, and goes on from there.
void KxCurlUploadSession::uploadChunk(const QByteArray& data, Chunk kind)
{
    mChecksums.add(data);
    const quint64 end = mChecksums.length();
    if (kind == Chunk::Last)
        mTotal = end;
    // The last chunk is done when the object is made, any other when its last byte is confirmed.
    const auto isDone = [&] { return mTotal ? mIsComplete : mNextOffset == end; };

    RetryPolicy policy;
    int shortWrites = 0;
    bool isFirst = true;
    bool isAnswered = true;
    const bool isSent = repeat(policy, kChunk, [&] {
        // What became of the attempt before only the storage knows, be it that its answer was lost.
        if (!std::exchange(isFirst, false))
            reset(policy);
        for (quint64 before = mNextOffset; !isDone(); before = mNextOffset) {
            // What the storage has of the chunk is skipped; the rest is sent from where it lies.
            const auto left = static_cast<int>(end - mNextOffset);
            isAnswered = false;
            sendChunk(QByteArray::fromRawData(data.constData() + data.size() - left, left), kind);
            isAnswered = true;
            // A short write is an answer, not a fault: the rest follows at once and no attempt is counted.
            const bool isShortWrite = mNextOffset > before && ++shortWrites <= kMaxShortWrites;
            if (!isShortWrite)
                return isDone();
        }
        return true;
    });
    if (!isSent)
        throw RetryPolicyExhaustedError(isAnswered ? kChunkExhausted : kResetExhausted, mLastFault);
}

void KxCurlUploadSession::sendChunk(const QByteArray& rest, Chunk kind)
{
    const quint64 start = mNextOffset;
    const quint64 end = start + static_cast<quint64>(rest.size());
    std::string range = "Content-Range: bytes ";
    // An empty rest has no range; it only says how long the object is.
    range += rest.isEmpty() ? "*" : std::to_string(start) + '-' + std::to_string(end - 1);
    range += '/' + (kind == Chunk::Last ? std::to_string(end) : std::string("*"));
    // Before it is sent: of a transfer that breaks off all bytes may have come.
    mSentEnd = std::max(mSentEnd, end);
    const int code = exchange("PUT", mSessionUrl, {contentLength(rest.size()), range}, rest);
    // Any other code leaves the position where it was, so that the attempt counts as failed.
    if (code != kResumeIncomplete && !mIsComplete)
        isInVain(code, kChunk);
    if (!mIsComplete && mNextOffset != end)
        LogFile::warnf("Short write to Google Cloud Storage.\nContent length: %zu\nActually written: %zu",
                       static_cast<std::size_t>(rest.size()), static_cast<std::size_t>(mNextOffset - start));
}

/// Only an answer about the upload tells where it stands. After any other the chunk would be sent to a place where the
/// storage may no longer be.
void KxCurlUploadSession::reset(RetryPolicy& policy)
{
    const bool isKnown = repeat(policy, kReset, [this] {
        const int code = exchange("PUT", mSessionUrl, {contentLength(0), "Content-Range: bytes */*"});
        return code == kResumeIncomplete || mIsComplete || isInVain(code, kReset);
    });
    if (!isKnown)
        throw RetryPolicyExhaustedError(kResetExhausted, mLastFault);
}

/// A transfer that did not come through.
void KxCurlUploadSession::note(const CurlError& error, const UploadStep& step)
{
    LogFile::write(step.severity, step.faultText + textForLog(error));
    mLastFault = error.what();
    // It becomes part of a message of one line.
    std::replace(mLastFault.begin(), mLastFault.end(), '\n', ' ');
}

/// An answer that brings the step no further; false, as the result of its attempt.
bool KxCurlUploadSession::isInVain(int code, const UploadStep& step)
{
    mLastFault = codeText(code);
    LogFile::warnf("%s while %s resumable upload", mLastFault.c_str(), step.name);
    return false;
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
    // Without an address there is no session: a server that answers the start by 200 has not made one.
    const bool isOpen = !mSessionUrl.empty();
    if (isOpen && (status.code == kOk || status.code == kCreated)) {
        takeEnd(request);
        return;
    }
    if (isUnrecoverable(status.code))
        throw UnrecoverableResponseError(
            codeText(status.code) +
            "indicates that this upload session failed and can not be recovered from.");
    if (const std::string* const location = findHeader(status, "location"))
        takeLocation(*location);
    if (const std::string* const range = findHeader(status, "range"))
        takeRange(*range);
}

void KxCurlUploadSession::takeLocation(const std::string& location)
{
    const std::string& base = mSessionUrl.empty() ? mTarget.url : mSessionUrl;
    const std::string url = resolvedUrl(base, location);
    const WebOrigin origin = originOf(url);
    if (!origin.isValid() || leavesTls(originOf(mTarget.url), origin))
        throw UnrecoverableResponseError("The cloud storage names \"" + location +
                                         "\" as the upload session, where nothing can be sent in safety");
    mSessionUrl = url;
}

void KxCurlUploadSession::takeRange(const std::string& range)
{
    constexpr std::string_view kPrefix = "bytes=0-";
    // Of another form it says nothing of how far the storage has come.
    if (range.compare(0, kPrefix.size(), kPrefix) != 0)
        return;
    quint64 last = 0;
    const char* const textEnd = range.data() + range.size();
    const auto [numberEnd, error] = std::from_chars(range.data() + kPrefix.size(), textEnd, last);
    const bool isNumber = error == std::errc() && numberEnd == textEnd;
    if (!isNumber || last >= mSentEnd || last + 1 < mNextOffset)
        throw UnrecoverableResponseError("The cloud storage claims to have \"" + range + "\" after " +
                                         std::to_string(mNextOffset) + " bytes were stored and " +
                                         std::to_string(mSentEnd) + " sent");
    mNextOffset = last + 1;
}

void KxCurlUploadSession::takeEnd(const KxCurlRequest& request)
{
    // Else an object that lacks its end would pass for the whole.
    if (!mTotal || mSentEnd < *mTotal)
        throw UnrecoverableResponseError(
            "The cloud storage ended the upload before the last bytes were sent");
    const Result result = mChecksums.compare(request.status(), request.response())
                              .within(QStringLiteral("The object in the cloud storage is not what was sent"));
    if (result.bad())
        throw UnrecoverableResponseError(result.text().toStdString());
    mNextOffset = *mTotal;
    mIsComplete = true;
}

}  // namespace Kdd
