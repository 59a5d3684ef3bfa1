#pragma once

#include "kddlib/net/dicom/DownloadProducer.h"
#include "platform/base/Export.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcistrma.h>

namespace Kdd
{

/// A download as the source of DCMTK's parser. Used by one thread at a time.
class KDD_EXPORT DcmCurlProducer : public DownloadProducer
{
public:
    using DownloadProducer::DownloadProducer;
};

/// A download as DCMTK's parser reads it. Values cannot be left where they are to be read later: the parser has to be
/// told to read all of them. Used by one thread at a time.
class KDD_EXPORT DcmInputCurlStream : public DcmInputStream
{
public:
    explicit DcmInputCurlStream(KxCurlDownloadStream&& stream);

    /// The parser never has to wait for a second call.
    static OFBool suspend() { return OFFalse; }

    /// None: what has been read cannot be had again.
    DcmInputStreamFactory* newFactory() const override { return nullptr; }

    KxCurlDownloadStream& curlStream() { return mProducer.stream(); }

    /// Bytes handed to the parser, and of the object in all.
    qint64 bytesRead() const { return mProducer.bytesRead(); }
    qint64 length() const { return mProducer.length(); }

private:
    DcmCurlProducer mProducer;
};

}  // namespace Kdd
