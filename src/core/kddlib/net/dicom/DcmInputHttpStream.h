#pragma once

#include "kddlib/net/dicom/DownloadInputStream.h"
#include "platform/base/Export.h"

#include <string>

namespace Kdd
{

/// A request of its own as the source of DCMTK's parser. Without one it is in error. Used by one thread at a time.
class KDD_EXPORT DcmHttpProducer : public DownloadProducer
{
public:
    /// Sends the token, when it is not empty, as "Authorization: Bearer ...". What cannot even be sent throws as
    /// `KxCurlClient::read` does.
    void request(const std::string& url, const std::string& bearerToken);
};

/// A file of a storage server, asked for by the stream itself, as DCMTK's parser reads it. Used by one thread at a time.
class KDD_EXPORT DcmInputHttpStream : public DownloadInputStream
{
public:
    DcmInputHttpStream();

    /// For requests that follow; null or empty: none.
    void setBearerToken(const char* token);

    /// Asks for the object. The stream is in error when that is refused. Throws as `KxCurlClient::read`.
    void request(const char* url) { mProducer.request(url, mBearerToken); }

    /// How long was waited for bytes of the body [s].
    float elapsedNetworkTime() const { return static_cast<float>(mProducer.networkTime()) / 1000.0F; }

private:
    DcmHttpProducer mProducer;
    std::string mBearerToken;
};

}  // namespace Kdd
