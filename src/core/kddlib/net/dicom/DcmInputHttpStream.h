#pragma once

#include "kddlib/net/dicom/DownloadProducer.h"
#include "platform/base/Export.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcistrma.h>

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

/// A file of a storage server as DCMTK's parser reads it. As with a download, all values have to be read at once.
/// Used by one thread at a time.
class KDD_EXPORT DcmInputHttpStream : public DcmInputStream
{
public:
    DcmInputHttpStream();

    /// For requests that follow; null or empty: none.
    void setBearerToken(const char* token);

    /// Asks for the object. The stream is in error when that is refused. Throws as `KxCurlClient::read`.
    void request(const char* url) { mProducer.request(url, mBearerToken); }

    /// As in DcmInputCurlStream.
    static OFBool suspend() { return OFFalse; }
    DcmInputStreamFactory* newFactory() const override { return nullptr; }

    KxCurlDownloadStream& curlStream() { return mProducer.stream(); }

    /// Bytes handed to the parser, and of the object in all.
    qint64 bytesRead() const { return mProducer.bytesRead(); }
    qint64 length() const { return mProducer.length(); }

    /// How long was waited for bytes of the body [s].
    float elapsedNetworkTime() const { return static_cast<float>(mProducer.networkTime()) / 1000.0F; }

private:
    DcmHttpProducer mProducer;
    std::string mBearerToken;
};

}  // namespace Kdd
