#pragma once

#include "kddlib/net/dicom/DownloadInputStream.h"
#include "platform/base/Export.h"

namespace Kdd
{

/// A download as the source of DCMTK's parser. Used by one thread at a time.
class KDD_EXPORT DcmCurlProducer : public DownloadProducer
{
public:
    using DownloadProducer::DownloadProducer;
};

/// A download that has begun as DCMTK's parser reads it. Used by one thread at a time.
class KDD_EXPORT DcmInputCurlStream : public DownloadInputStream
{
public:
    explicit DcmInputCurlStream(KxCurlDownloadStream&& stream);

private:
    DcmCurlProducer mProducer;
};

}  // namespace Kdd
