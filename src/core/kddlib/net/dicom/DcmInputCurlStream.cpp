#include "kddlib/net/dicom/DcmInputCurlStream.h"

#include <utility>

namespace Kdd
{

/// The base class only keeps where the producer is, which is made after it.
DcmInputCurlStream::DcmInputCurlStream(KxCurlDownloadStream&& stream)
    : DownloadInputStream(mProducer)
    , mProducer(std::move(stream))
{
}

}  // namespace Kdd
