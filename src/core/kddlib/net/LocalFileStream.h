#pragma once

#include "kddlib/net/BufferedFileProducer.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcistrmf.h>

namespace Kdd
{

/// A local file as the parser reads it.
class LocalFileStream : public DcmInputStream
{
public:
    explicit LocalFileStream(const char* path)
        : DcmInputStream(&mProducer)
        , mProducer(path)
        , mPath(path)
    {
    }

    /// How DCMTK finds a long value again that it has left in the file. In deflated data no offset leads to it.
    DcmInputStreamFactory* newFactory() const override
    {
        return currentProducer() == &mProducer ? new DcmInputFileStreamFactory(mPath, tell()) : nullptr;
    }

private:
    BufferedFileProducer mProducer;
    OFFilename mPath;
};

}  // namespace Kdd
