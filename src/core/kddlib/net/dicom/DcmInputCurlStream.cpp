#include "kddlib/net/dicom/DcmInputCurlStream.h"

#include <utility>

namespace Kdd
{

DcmInputCurlStream::DcmInputCurlStream(KxCurlDownloadStream&& stream)
    : DownloadInputStream(mProducer)
    , mProducer(std::move(stream))
{
}

}  // namespace Kdd
