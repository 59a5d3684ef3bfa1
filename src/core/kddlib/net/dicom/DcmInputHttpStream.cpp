#include "kddlib/net/dicom/DcmInputHttpStream.h"

#include "kddlib/net/KxCurlClient.h"

namespace Kdd
{

void DcmHttpProducer::request(const std::string& url, const std::string& bearerToken)
{
    std::vector<std::string> headers;
    if (!bearerToken.empty())
        headers.push_back("Authorization: Bearer " + bearerToken);
    setStream(KxCurlClient::instance().read(url, headers, false));
}

/// The base class only keeps where the producer is, which is made after it.
DcmInputHttpStream::DcmInputHttpStream()
    : DownloadInputStream(mProducer)
{
}

void DcmInputHttpStream::setBearerToken(const char* token)
{
    mBearerToken = token ? token : "";
}

}  // namespace Kdd
