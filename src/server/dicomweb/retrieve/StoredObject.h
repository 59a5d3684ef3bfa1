#pragma once

#include "server/http/Response.h"

#include <kddlib/FrameIndex.h>
#include <kddlib/KxCompressedDataMedia.h>

#include <memory>

namespace Kdd::DicomWeb
{

/// The bytes of a DICOM file, wherever they are. Used by one thread at a time; what `part` gives is independent of it.
class StoredObject : public MediaSource
{
public:
    /// Which file it is, in which state.
    virtual QByteArray identity() const = 0;

    /// Whether the identity is that of no other state of the file; not so while it may still be written.
    virtual bool isSettled() const { return true; }

    /// A stretch of it to be sent.
    virtual Http::BodyPart part(const FileStretch& stretch) const = 0;

    /// Appends several, in order.
    void append(const QVector<FileStretch>& stretches, std::vector<Http::BodyPart>& body) const;
};

/// A file of this machine.
class LocalObject : public StoredObject
{
public:
    explicit LocalObject(std::shared_ptr<const Http::OpenFile> file)
        : mFile(std::move(file))
    {
    }

    qint64 size() const override { return mFile->size(); }
    qint64 read(qint64 offset, char* out, qint64 length) override;
    QByteArray identity() const override { return mFile->identity(); }
    bool isSettled() const override { return mFile->isSettled(); }
    Http::BodyPart part(const FileStretch& stretch) const override;

private:
    std::shared_ptr<const Http::OpenFile> mFile;
};

/// A file that had to be converted.
class MemoryObject : public StoredObject
{
public:
    MemoryObject(const QByteArray& bytes, const QByteArray& identity)
        : mBytes(bytes)
        , mIdentity(identity)
    {
    }

    qint64 size() const override { return mBytes.size(); }
    qint64 read(qint64 offset, char* out, qint64 length) override;
    QByteArray identity() const override { return mIdentity; }
    Http::BodyPart part(const FileStretch& stretch) const override;

private:
    QByteArray mBytes;
    QByteArray mIdentity;
};

}  // namespace Kdd::DicomWeb
