#pragma once

#include "kddlib/net/dicom/RemoteFile.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcerror.h>
#include <dcmtk/dcmdata/dcistrma.h>

#include <memory>
#include <utility>

namespace Kdd
{

/// A file behind a URL as the source of a DCMTK input stream, from byte `offset` (0-based) on. What is passed over is not
/// fetched.
class RemoteFileProducer : public DcmProducer
{
public:
    RemoteFileProducer(std::shared_ptr<RemoteFile> file, qint64 offset)
        : mFile(std::move(file))
        , mPosition(offset)
    {
    }

    const std::shared_ptr<RemoteFile>& file() const { return mFile; }

    OFBool good() const override { return mStatus.good(); }
    OFCondition status() const override { return mStatus; }
    OFBool eos() override { return mPosition >= mFile->size(); }
    offile_off_t avail() override { return mFile->size() - mPosition; }

    offile_off_t read(void* bytes, offile_off_t count) override
    {
        const qint64 got = good() ? mFile->readAt(mPosition, bytes, qMax<qint64>(0, count)) : 0;
        if (got < 0)
            mStatus = EC_InvalidStream;
        mPosition += qMax<qint64>(0, got);
        return qMax<qint64>(0, got);
    }

    offile_off_t skip(offile_off_t count) override
    {
        const qint64 skipped = good() ? qBound<qint64>(0, count, avail()) : 0;
        mPosition += skipped;
        return skipped;
    }

    void putback(offile_off_t count) override
    {
        if (count > mPosition)
            mStatus = EC_PutbackFailed;
        else
            mPosition -= count;
    }

private:
    std::shared_ptr<RemoteFile> mFile;
    qint64 mPosition;
    OFCondition mStatus;
};

/// The same as the parser reads it. Long values stay where they are until they are asked for, and are fetched then if the
/// object is still the same.
class RemoteFileStream : public DcmInputStream
{
public:
    explicit RemoteFileStream(std::shared_ptr<RemoteFile> file, qint64 offset = 0)
        : DcmInputStream(&mProducer)
        , mProducer(std::move(file), offset)
        , mStart(offset)
    {
    }

    /// In deflated data no offset leads to a value.
    DcmInputStreamFactory* newFactory() const override;

private:
    RemoteFileProducer mProducer;
    qint64 mStart;
};

/// Leads back to a value that was left where it is.
class RemoteValueFactory : public DcmInputStreamFactory
{
public:
    RemoteValueFactory(std::shared_ptr<RemoteFile> file, qint64 offset)
        : mFile(std::move(file))
        , mOffset(offset)
    {
    }

    DcmInputStream* create() const override { return new RemoteFileStream(mFile, mOffset); }
    DcmInputStreamFactory* clone() const override { return new RemoteValueFactory(*this); }
    DcmInputStreamFactoryType ident() const override { return DFT_DcmInputFileStreamFactory; }

private:
    std::shared_ptr<RemoteFile> mFile;
    qint64 mOffset;  // 0-based
};

inline DcmInputStreamFactory* RemoteFileStream::newFactory() const
{
    const bool isPlain = currentProducer() == &mProducer;
    return isPlain ? new RemoteValueFactory(mProducer.file(), mStart + tell()) : nullptr;
}

}  // namespace Kdd
