#pragma once

#include "kddlib/net/dicom/BufferedFileProducer.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcistrma.h>

#include <string>
#include <utility>

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

    /// The rest of a file behind `offset`, which is in error when it is not the file of `identity` any more.
    LocalFileStream(const std::string& path, qint64 offset, const FileIdentity& identity)
        : DcmInputStream(&mProducer)
        , mProducer(path.c_str(), offset, identity)
        , mPath(path)
        , mStart(offset)
    {
    }

    /// How DCMTK finds a long value again that it has left in the file. In deflated data no offset leads to it.
    DcmInputStreamFactory* newFactory() const override;

private:
    BufferedFileProducer mProducer;
    std::string mPath;
    qint64 mStart = 0;
};

/// Opens a file again for a value that was left in it. A file that was written anew has other bytes at that place, and
/// they would pass for the value.
class LeftValueFactory : public DcmInputStreamFactory
{
public:
    LeftValueFactory(std::string path, qint64 offset, const FileIdentity& identity)
        : mPath(std::move(path))
        , mOffset(offset)
        , mIdentity(identity)
    {
    }

    DcmInputStream* create() const override { return new LocalFileStream(mPath, mOffset, mIdentity); }
    DcmInputStreamFactory* clone() const override { return new LeftValueFactory(*this); }
    DcmInputStreamFactoryType ident() const override { return DFT_DcmInputFileStreamFactory; }

private:
    std::string mPath;
    qint64 mOffset;  // 0-based
    FileIdentity mIdentity;
};

inline DcmInputStreamFactory* LocalFileStream::newFactory() const
{
    const bool isPlain = currentProducer() == &mProducer;
    return isPlain ? new LeftValueFactory(mPath, mStart + tell(), mProducer.identity()) : nullptr;
}

}  // namespace Kdd
