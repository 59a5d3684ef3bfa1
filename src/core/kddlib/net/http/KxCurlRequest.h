#pragma once

#include "kddlib/Limits.h"
#include "kddlib/net/http/CurlOptions.h"
#include "kddlib/net/http/HeaderReceiver.h"
#include "kddlib/net/http/KxCurlHandleFactory.h"
#include "kddlib/net/http/KxHttpStatus.h"

#include <QByteArray>

#include <chrono>
#include <memory>
#include <string>

namespace Kdd
{

class CurlShare;

/// One request from its making to its answer, which is held in memory. Redirects are answers, not followed.
///
/// Used by one thread, for one transfer. `share` must outlive it.
class KxCurlRequest
{
public:
    /// `method` is sent as it stands: "GET", "POST", "PUT" or "DELETE". CurlError when curl refuses an option.
    KxCurlRequest(std::shared_ptr<KxCurlHandleFactory> factory, const CurlShare& share,
                  const std::string& url, const std::string& method);

    /// Gives the handle back.
    ~KxCurlRequest();
    KxCurlRequest(const KxCurlRequest&) = delete;
    KxCurlRequest& operator=(const KxCurlRequest&) = delete;

    /// Demands that the server prove by its certificate who it is, whatever the site's settings say of others: by those in
    /// `caFile` (PEM); when that is empty those of the site's settings, or else of the system. Nothing older than TLS 1.2 is spoken then.
    void demandProof(const QByteArray& caFile);

    /// Fails the transfer beyond so much of a body [bytes] or time. Without it Limits.h bounds the one and a stall the
    /// other.
    void setBounds(qint64 most, std::chrono::milliseconds time);

    /// As HeaderLines::add.
    void addHeader(const std::string& line) { mHeaders.add(line); }

    /// Runs the transfer. CurlError when it does not come through, be it for a response beyond the bounds of
    /// Limits.h; what has arrived by then stays, and the status counts as failed. An error that the server reports by
    /// its code is an answer like any other.
    void perform();

    /// The same with a body, which may be empty and still is one.
    void perform(const QByteArray& body);

    const KxHttpStatus& status() const { return mStatus; }

    /// The body of the response.
    const QByteArray& response() const { return mResponse; }

private:
    static std::size_t receiveBody(char* bytes, std::size_t size, std::size_t count, void* request);
    void takeBody(const char* bytes, std::size_t length);
    void run();

    CurlErrorText mErrorText{};
    std::shared_ptr<KxCurlHandleFactory> mFactory;
    CurlEasy mEasy;
    CurlOptions mOptions;
    HeaderLines mHeaders;
    KxHttpStatus mStatus;
    CallbackFault mFault;
    HeaderReceiver mHeaderReceiver;
    QByteArray mResponse;
    qint64 mMost = kMaxResponseSize;
};

}  // namespace Kdd
