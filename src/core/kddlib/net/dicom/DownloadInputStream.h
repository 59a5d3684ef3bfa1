#pragma once

#include "kddlib/net/dicom/DownloadProducer.h"
#include "platform/base/Export.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcistrma.h>

namespace Kdd
{

/// An object of the network as DCMTK's parser reads it, wherever its bytes come from. Values cannot be left where they
/// are to be read later: the parser has to be told to read all of them. Used by one thread at a time.
class KDD_EXPORT DownloadInputStream : public DcmInputStream
{
public:
    /// The parser never has to wait for a second call.
    static OFBool suspend() { return OFFalse; }

    /// None: what has been read cannot be had again.
    DcmInputStreamFactory* newFactory() const override { return nullptr; }

    KxCurlDownloadStream& curlStream() { return mDownload.stream(); }

    /// Bytes handed to the parser, and of the object in all.
    qint64 bytesRead() const { return mDownload.bytesRead(); }
    qint64 length() const { return mDownload.length(); }

protected:
    /// `producer` belongs to the class that derives from this one, and is only kept here.
    explicit DownloadInputStream(DownloadProducer& producer)
        : DcmInputStream(&producer)
        , mDownload(producer)
    {
    }

private:
    DownloadProducer& mDownload;
};

}  // namespace Kdd
