#include "kddlib/net/http/KxCurlDownloadRequest.h"

#include "kddlib/net/http/HttpAnswer.h"
#include "platform/base/LogFile.h"

#include <algorithm>
#include <cstring>
#include <string_view>
#include <utility>

namespace Kdd
{
namespace
{

/// Of a request whose length is not known beforehand. Must hold the largest block that curl offers, else a paused
/// request could never go on; more spares the pauses.
constexpr std::size_t kSpillCapacity = 1024 * 1024;  // [bytes]

/// What curl takes from the socket at a time. More than its default of 16 KiB, so that the system is asked less often.
constexpr long kReceiveBuffer = 256 * 1024;  // [bytes]

constexpr char kRangeIgnored[] = "The server sends the whole object where a range was asked for";

/// The range that a header line asks for.
WantedRange rangeOf(std::string_view headerLine)
{
    constexpr std::string_view kUnit = "bytes=";
    const std::size_t start = headerLine.find(kUnit);
    const bool isInBytes = start != std::string_view::npos;
    return WantedRange(isInBytes ? headerLine.substr(start + kUnit.size()) : std::string_view());
}

std::size_t spillCapacity(const std::optional<ByteRange>& range)
{
    // A range that is fetched ahead of the reader must find room as a whole, else its connection would stand still.
    return range ? std::max(static_cast<std::size_t>(range->length()), kSpillCapacity) : kSpillCapacity;
}

}  // namespace

KxCurlDownloadRequest::KxCurlDownloadRequest(const Origin& origin, std::optional<ByteRange> range,
                                             std::optional<Expected> expected)
    : mMulti(origin.multi)
    , mBody(origin.body)
    , mRange(range)
    , mExpected(std::move(expected))
    , mSpill(mMulti->blocks(), spillCapacity(range))
    , mHeaderReceiver(mStatus, mFault)
    , mEasy(mMulti->factory().takeEasy())
{
    try {
        setUp(origin);
        mMulti->add(*this);
    } catch (...) {
        // The destructor will not run, and the handle must not keep pointers into what is going.
        mMulti->factory().giveBack(std::move(mEasy));
        throw;
    }
}

KxCurlDownloadRequest::~KxCurlDownloadRequest()
{
    abort();
    mMulti->factory().giveBack(std::move(mEasy));
}

void KxCurlDownloadRequest::setUp(const Origin& origin)
{
    CurlOptions options(mEasy.get(), mErrorText);
    const PreparedRequest prepared = origin.prepare();
    options.setTransport(prepared.url, *origin.share, mMulti->factory());
    addHeaders(prepared);
    options.set(CURLOPT_HTTPHEADER, mHeaders.list());
    if (origin.hasBody == RequestBody::Sent) {
        options.set(CURLOPT_POST, 1L);
        options.set(CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(mBody.size()));
        options.set(CURLOPT_POSTFIELDS, mBody.constData());
    }
    // Ranges are fetched in parallel to have a connection each; HTTP/2 would put them all on one.
    if (mRange)
        options.set(CURLOPT_HTTP_VERSION, static_cast<long>(CURL_HTTP_VERSION_1_1));
    // Refused by a handle that has kept its buffer from a transfer that did not begin. A shorter one serves as well.
    curl_easy_setopt(mEasy.get(), CURLOPT_BUFFERSIZE, kReceiveBuffer);
    options.set(CURLOPT_WRITEFUNCTION, &receiveBody);
    options.set(CURLOPT_WRITEDATA, this);
    mHeaderReceiver.attach(mEasy.get());
}

void KxCurlDownloadRequest::addHeaders(const PreparedRequest& prepared)
{
    for (const std::string& line : prepared.headers) {
        const bool isRange = isRangeHeader(line);
        if (isRange && !mRange)
            mCallersRange = rangeOf(line);
        if (!isRange || !mRange)
            mHeaders.add(line);
    }
    if (mRange)
        mHeaders.add("Range: " + mRange->text());
}

std::size_t KxCurlDownloadRequest::read(char* to, std::size_t count)
{
    // Set before anything else: from here on curl's callbacks deliver straight to the reader.
    mTo = to;
    mWanted = count;
    mDelivered = 0;
    deliver();
    // What has arrived before may be enough; the transfers are then only moved on now and then.
    if (!hasReader())
        mMulti->noteRead(*this, count);
    else if (!mDone && resume())
        mMulti->drive(*this, [this] { return !hasReader(); });
    // Nothing of the caller's memory is touched once this returns.
    mTo = nullptr;
    mWanted = 0;
    return std::exchange(mDelivered, 0);
}

/// Moves what has arrived to the reader.
void KxCurlDownloadRequest::deliver()
{
    const std::size_t count = mSpill.take(mTo + mDelivered, mWanted - mDelivered);
    mDelivered += count;
}

/// Curl refuses to continue what it has not begun, so it is asked only after a pause.
bool KxCurlDownloadRequest::resume()
{
    if (!mPaused)
        return true;
    mPaused = false;  // before the call, out of which curl offers the bytes again
    const CURLcode code = curl_easy_pause(mEasy.get(), CURLPAUSE_CONT);
    if (code == CURLE_OK)
        return true;
    fail(curl_easy_strerror(code), "curl_easy_pause");
    return false;
}

void KxCurlDownloadRequest::abort()
{
    // Marked first, so that bytes which curl still offers are refused.
    mAborted = true;
    mDone = true;
    mMulti->remove(*this);
}

void KxCurlDownloadRequest::fail(const std::string& reason, const char* what)
{
    // What comes after the first fault is its consequence.
    if (mStatus.failed)
        return;
    LogFile::tracef(3, "CURL", "%s: %s", what, reason.c_str());
    mStatus.failed = true;
    mStatus.failure = reason;
}

std::string KxCurlDownloadRequest::reasonOf(CURLcode code) const
{
    const std::string reason = mErrorText[0] ? mErrorText.data() : curl_easy_strerror(code);
    const std::string cure = CurlError::cureFor(code);
    return cure.empty() ? reason : reason + ". " + cure;
}

/// Called when curl is done with the transfer, be it well or badly. An answer
/// without body has not been judged by then.
void KxCurlDownloadRequest::complete(CURLcode code)
{
    mDone = true;
    mMulti->remove(*this);
    if (mAnswer == Answer::Awaited && code == CURLE_OK)
        judgeAnswer();
    // These ended the transfer themselves: that curl calls it an error says nothing.
    if (mAborted || needsWholeObject() || mAnswer == Answer::Refused)
        return;
    try {
        // What a callback threw is the cause; curl only knows that the callback gave up.
        mFault.rethrow();
        if (code != CURLE_OK)
            fail(reasonOf(code));
        else
            checkLength();
    } catch (const std::exception& fault) {
        fail(fault.what());
    }
}

std::size_t KxCurlDownloadRequest::receiveBody(char* bytes, std::size_t size, std::size_t count,
                                               void* request)
{
    auto& self = *static_cast<KxCurlDownloadRequest*>(request);
    std::size_t taken = 0;
    self.mFault.guard(0, [&] { taken = self.takeBody(bytes, size * count); });
    return taken;
}

/// Returns `length`, curl's code for a pause, or 0 to end the transfer.
std::size_t KxCurlDownloadRequest::takeBody(const char* bytes, std::size_t length)
{
    if (mAnswer == Answer::Awaited)
        judgeAnswer();
    if (mAborted || mAnswer != Answer::Taken)
        return 0;
    // Bytes beyond it would stand where those of the next range belong.
    if (mPart && mStatus.bytesReceived + length > static_cast<quint64>(mPart->range.length())) {
        refuse("The server sends more than the range that was asked for");
        return 0;
    }
    deliver();
    // What arrived earlier goes first, so that the reader gets the bytes in their order.
    const std::size_t direct = std::min(length, mWanted - mDelivered);
    // Decided before anything is copied, because after a pause curl offers the same bytes again.
    if (length - direct > mSpill.room()) {
        mPaused = true;
        return CURL_WRITEFUNC_PAUSE;
    }
    if (direct > 0)
        std::memcpy(mTo + mDelivered, bytes, direct);
    mDelivered += direct;
    mSpill.append(bytes + direct, length - direct);
    mStatus.bytesReceived += length;
    return length;
}

/// Called once the headers are in.
void KxCurlDownloadRequest::judgeAnswer()
{
    if (mRange)
        mAnswer = judgeRange();
    else if (mCallersRange)
        mAnswer = judgeCallersRange();
    else
        mAnswer = Answer::Taken;
}

KxCurlDownloadRequest::Answer KxCurlDownloadRequest::judgeRange()
{
    const int code = mStatus.code;
    // Part of the object has been delivered: neither a page that tells of an error nor the whole can follow.
    if (mExpected && code != kPartialContent)
        return refuse("The server answers a later range with code " + std::to_string(code));
    if (code == kOk && mRange->first > 0)
        return refuse(kRangeIgnored);
    if (code == kRangeNotSatisfiable && mRange->first == 0)
        return Answer::NoRanges;  // an empty object
    if (code != kPartialContent)
        return Answer::Taken;  // the whole object, or a page that tells of an error

    const std::optional<ContentRange> part = contentRangeOf(mStatus);
    if (!part)
        return refuse("The server does not say which range it sends");
    if (mExpected && (part->total != mExpected->total || ObjectVersion::of(mStatus) != mExpected->version))
        return refuse("The object has changed while it was fetched");
    const qint64 last = part->total < 0 ? mRange->last : std::min(mRange->last, part->total - 1);
    if (part->range.first != mRange->first || part->range.last != last)
        return refuse("The server sends " + part->range.text() + " where " + mRange->text() +
                      " was asked for");
    // Further ranges cannot be planned then. Nothing is lost by asking anew, unless the caller began midway.
    if (part->total < 0)
        return mRange->first == 0 ? Answer::NoRanges
                                  : refuse("The server does not say how long the object is");
    mPart = part;
    return Answer::Taken;
}

KxCurlDownloadRequest::Answer KxCurlDownloadRequest::judgeCallersRange()
{
    if (mStatus.code == kOk && !mCallersRange->isWholeObject())
        return refuse(kRangeIgnored);
    if (mStatus.code != kPartialContent || mCallersRange->isUnknown())
        return Answer::Taken;
    mPart = contentRangeOf(mStatus);
    if (!mPart || !mCallersRange->isAnsweredBy(*mPart))
        return refuse("The server sends another range than was asked for");
    return Answer::Taken;
}

KxCurlDownloadRequest::Answer KxCurlDownloadRequest::refuse(const std::string& reason)
{
    fail(reason);
    return mAnswer = Answer::Refused;
}

/// A range has a length even when the server announces none for the body.
void KxCurlDownloadRequest::checkLength()
{
    if (mPart && mStatus.bytesReceived != static_cast<quint64>(mPart->range.length()))
        fail("The range ends " +
             std::to_string(static_cast<quint64>(mPart->range.length()) - mStatus.bytesReceived) +
             " bytes early");
}

}  // namespace Kdd
