#pragma once

#include "kddlib/net/cloud/RetryPolicy.h"
#include "kddlib/net/cloud/UploadChecksums.h"
#include "kddlib/net/http/KxCurlHandleFactory.h"

#include <QByteArray>

#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace Kdd
{

class CurlError;
class CurlShare;
class KxCurlRequest;
struct UploadStep;

/// What is uploaded where.
struct UploadTarget
{
    std::string url;  ///< of the object at the storage's upload host

    /// Gives the header line for one request, empty when there is none at the moment; asked for each, because a long
    /// upload outlives its token. Empty itself: requests go out unauthorised.
    std::function<std::string()> authorization = {};
    std::string contentType = {};  ///< of the object; empty leaves it to the storage
};

/// A resumable upload to the cloud storage: opens a session there and sends an object in chunks, each as often as it
/// takes, from wherever the storage says that it has come to.
///
/// What the storage says is held against what was sent. A position that goes back, runs ahead or was never sent, an
/// end before the last chunk and a checksum that differs end the session. No answer makes it try for ever.
///
/// For one thread, which sleeps between attempts. Both operations throw RetryPolicyExhaustedError when a step failed too
/// often, UnrecoverableResponseError when there is no use in trying again, and std::runtime_error "Failed to add curl
/// request header". After that the session is of no further use.
class KxCurlUploadSession
{
public:
    using Sleep = std::function<void(std::chrono::milliseconds)>;
    enum class Chunk { Middle, Last };

    /// Chunks but the last have a multiple of this size [bytes].
    static constexpr int kGranularity = 256 * 1024;

    /// Opens the session. `share` must outlive it.
    KxCurlUploadSession(std::shared_ptr<KxCurlHandleFactory> factory, const CurlShare& share,
                        UploadTarget target, Sleep sleep);

    /// Sends the bytes that follow those of the chunks before; returns when the storage has them. The last chunk may be
    /// empty and makes the object.
    void uploadChunk(const QByteArray& data, Chunk kind);

    /// The storage has made the object.
    bool isComplete() const { return mIsComplete; }

private:
    /// Whether the step is done. A CurlError is a failed attempt, too.
    using Attempt = std::function<bool()>;

    /// Tries a step until it is done or the policy exhausted; which of both.
    bool repeat(RetryPolicy& policy, const UploadStep& step, const Attempt& attempt);

    void start();
    void sendChunk(const QByteArray& rest, Chunk kind);
    void reset(RetryPolicy& policy);
    void note(const CurlError& error, const UploadStep& step);
    bool isInVain(int code, const UploadStep& step);

    int exchange(const std::string& method, const std::string& url, const std::vector<std::string>& headers,
                 const QByteArray& body = {});
    std::vector<std::string> storageHeaders(const std::string& url) const;
    void take(const KxCurlRequest& request);
    void takeLocation(const std::string& location);
    void takeRange(const std::string& range);
    void takeEnd(const KxCurlRequest& request);

    std::shared_ptr<KxCurlHandleFactory> mFactory;
    const CurlShare& mShare;
    const UploadTarget mTarget;
    const Sleep mSleep;
    std::string mSessionUrl;
    quint64 mNextOffset = 0;        // the first byte that the storage has not confirmed
    quint64 mSentEnd = 0;           // behind the last byte that was ever on its way
    std::optional<quint64> mTotal;  // known from the last chunk on
    UploadChecksums mChecksums;
    std::string mLastFault;  // of a step that is tried again
    bool mIsComplete = false;
};

}  // namespace Kdd
