#pragma once

#include "kddlib/net/http/KxHttpStatus.h"
#include "platform/base/Export.h"

#include <istream>
#include <memory>
#include <string>

namespace Kdd
{

class KxCurlDownloadStreambuf;

/// An object of the network as a stream of bytes. Made by `KxCurlClient::read`; not seekable.
///
/// A read waits for the bytes it asks for. Transfers that break off throw nothing: the stream reaches its end, and
/// whoever needs to know that all has come asks `httpStatus().ok()` afterwards. All bytes delivered until then are the
/// object's own. The page that a server sends with an error code is delivered like any body.
///
/// Used by one thread at a time, which also carries the transfers on, inside its reads: between them the servers wait
/// once the buffers are full. How much memory that takes is told by `KxCurlClient::setChunkSizeForPartialRequests`.
class KDD_EXPORT KxCurlDownloadStream : public std::istream
{
public:
    /// Takes ownership of the buffer; null makes a stream that is at its end.
    explicit KxCurlDownloadStream(KxCurlDownloadStreambuf* buffer);
    ~KxCurlDownloadStream() override;

    /// What was moved from is closed.
    KxCurlDownloadStream(KxCurlDownloadStream&& other) noexcept;
    KxCurlDownloadStream& operator=(KxCurlDownloadStream&& other) noexcept;

    /// Whether more may come.
    bool isOpen() const;

    /// Ends all transfers. The status stays as it was.
    void close();

    /// The length of the whole object [bytes], also when a range of it is read; 0 when the server does not tell.
    qint64 contentLength() const;

    /// Of the request that is being read, or the one before while that has no answer, the last one at the end;
    /// `KxHttpStatus::empty()` without any. Valid until the next call or move.
    const KxHttpStatus& httpStatus();

    /// Why a transfer counts as failed; empty while it does not.
    std::string failure() { return httpStatus().failure; }

private:
    void takeBuffer(KxCurlDownloadStream& other);

    std::unique_ptr<KxCurlDownloadStreambuf> mBuffer;
    KxHttpStatus mStatus;
};

}  // namespace Kdd
