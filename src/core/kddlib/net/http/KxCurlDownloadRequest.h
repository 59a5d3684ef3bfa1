#pragma once

#include "kddlib/net/http/ByteRange.h"
#include "kddlib/net/http/CurlOptions.h"
#include "kddlib/net/http/HeaderReceiver.h"
#include "kddlib/net/http/KxCurlHandleFactory.h"
#include "kddlib/net/http/KxHttpStatus.h"
#include "kddlib/net/http/ObjectVersion.h"
#include "kddlib/net/http/PreparedRequest.h"
#include "kddlib/net/http/SpillBuffer.h"

#include <QByteArray>

#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>

namespace Kdd
{

class CurlShare;

/// One request of a download: receives into the reader's memory while a read is in progress, and into a buffer of its
/// own what arrives beside that.
///
/// Nothing is delivered before the answer is known to be the one that was asked for: a request for a range takes that
/// range of that object and nothing else. Whatever goes wrong after the start marks the status as failed, has its
/// reason in the trace log under "CURL" and in the status.
///
/// Used by one thread, as are all requests of one stream.
class KxCurlDownloadRequest
{
public:
    class MultiMap;

    /// What all requests of one download have in common. `share` must outlive them.
    struct Origin
    {
        std::shared_ptr<MultiMap> multi;
        const CurlShare* share = nullptr;

        /// Asked for each request, because a long download outlives the token by which it is authorised.
        std::function<PreparedRequest()> prepare;
        QByteArray body;
        RequestBody hasBody = RequestBody::None;
    };

    /// For a part of an object whose beginning has already come: the total length [bytes] and the version which the
    /// answer must be of.
    struct Expected
    {
        qint64 total;
        ObjectVersion version;
    };

    /// With a range it takes the place of one among the header lines. CurlError and std::runtime_error when the request
    /// cannot be set up.
    KxCurlDownloadRequest(const Origin& origin, std::optional<ByteRange> range,
                          std::optional<Expected> expected = std::nullopt);

    /// Breaks off what is still under way and gives the handle back.
    ~KxCurlDownloadRequest();
    KxCurlDownloadRequest(const KxCurlDownloadRequest&) = delete;
    KxCurlDownloadRequest& operator=(const KxCurlDownloadRequest&) = delete;

    /// Waits until `count` bytes have come or no more will; returns how many came. The other requests of the stream go
    /// on meanwhile.
    std::size_t read(char* to, std::size_t count);

    /// Breaks off; what has arrived can still be read.
    void abort();

    /// Marks the transfer as failed, for the first reason given. `what` failed, for the log.
    void fail(const std::string& reason, const char* what = "transfer");

    /// What was asked for; nothing when it was the whole object.
    const std::optional<ByteRange>& range() const { return mRange; }

    bool isDone() const { return mDone; }
    bool hasUnread() const { return !mSpill.isEmpty(); }

    /// Whether the request was for a range and the server does not deliver such, or does not tell where the object
    /// ends. Then none of its bytes is delivered, and the object is to be fetched in one piece.
    bool needsWholeObject() const { return mAnswer == Answer::NoRanges; }

    /// The range that is being delivered, cut at the object's end; nothing while it is not known, and when the server
    /// sends the whole object instead.
    const std::optional<ContentRange>& part() const { return mPart; }

    const KxHttpStatus& status() const { return mStatus; }

private:
    friend class MultiMap;

    enum class Answer { Awaited, Taken, NoRanges, Refused };

    void setUp(const Origin& origin);
    void addHeaders(const PreparedRequest& prepared);
    bool resume();
    void deliver();
    void complete(CURLcode code);
    std::string reasonOf(CURLcode code) const;

    static std::size_t receiveBody(char* bytes, std::size_t size, std::size_t count, void* request);
    std::size_t takeBody(const char* bytes, std::size_t length);
    bool hasReader() const { return mDelivered < mWanted; }

    void judgeAnswer();
    Answer judgeRange();
    Answer judgeCallersRange();
    Answer refuse(const std::string& reason);
    void checkLength();

    std::shared_ptr<MultiMap> mMulti;
    QByteArray mBody;  // curl reads it from here
    std::optional<ByteRange> mRange;
    std::optional<WantedRange> mCallersRange;
    std::optional<Expected> mExpected;
    std::optional<ContentRange> mPart;
    Answer mAnswer = Answer::Awaited;

    char* mTo = nullptr;  // where the read in progress wants its bytes
    std::size_t mWanted = 0;
    std::size_t mDelivered = 0;
    SpillBuffer mSpill;
    bool mDone = false;
    bool mAborted = false;
    bool mPaused = false;

    KxHttpStatus mStatus;
    CurlErrorText mErrorText{};
    CallbackFault mFault;
    HeaderReceiver mHeaderReceiver;
    HeaderLines mHeaders;
    CurlEasy mEasy;
};

/// Carries the requests of one stream side by side. Owned by them and the stream together; the handle goes back to the
/// factory with the last.
class KxCurlDownloadRequest::MultiMap
{
public:
    explicit MultiMap(std::shared_ptr<KxCurlHandleFactory> factory);
    ~MultiMap();
    MultiMap(const MultiMap&) = delete;
    MultiMap& operator=(const MultiMap&) = delete;

    KxCurlHandleFactory& factory() { return *mFactory; }
    SpillBlocks& blocks() { return mBlocks; }

    /// Lets a request begin. CurlError when curl refuses.
    void add(KxCurlDownloadRequest& request);

    /// Takes a request out, however far it has come; one that is not in is left alone.
    void remove(KxCurlDownloadRequest& request);

    /// Moves all requests on, waiting where nothing can be done, until `isEnough` or `reader` is done. Faults of curl
    /// itself fail the reader.
    void drive(KxCurlDownloadRequest& reader, const std::function<bool()>& isEnough);

    /// Tells of bytes that were read without driving. From time to time all requests are moved on as far as they go
    /// without waiting, so that a reader who lives on what has arrived does not make the servers wait.
    void noteRead(KxCurlDownloadRequest& reader, std::size_t count);

private:
    bool perform(KxCurlDownloadRequest& reader, int& running);
    void takeCompletions();
    bool wait(KxCurlDownloadRequest& reader);

    std::shared_ptr<KxCurlHandleFactory> mFactory;
    CurlMulti mMulti;
    std::map<CURL*, KxCurlDownloadRequest*> mRequests;
    SpillBlocks mBlocks;
    std::size_t mReadSinceDriven = 0;
};

}  // namespace Kdd
