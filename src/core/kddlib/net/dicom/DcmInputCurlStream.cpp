#include "kddlib/net/dicom/DcmInputCurlStream.h"

#include <utility>

namespace Kdd
{

DcmInputCurlStream::DcmInputCurlStream(KxCurlDownloadStream&& stream)
    : DcmInputStream(&mProducer)
    , mProducer(std::move(stream))
{
}

}  // namespace Kdd
