#pragma once

#include "platform/os/RandomAccessFile.h"

#include <QtGlobal>

namespace Kdd
{

/// Where the bytes of a DICOM file come from that is read by `readPlainFile`.
class PlainSource
{
public:
    virtual ~PlainSource() = default;

    /// [bytes]
    virtual qint64 size() const = 0;

    /// Reads up to `count` bytes at `offset` (0-based), fewer only at the end; -1 when they cannot be had.
    virtual qint64 readAt(qint64 offset, void* bytes, qint64 count) = 0;

    /// Whether all that was read is of one state of the file.
    virtual bool isUnchanged() = 0;

protected:
    PlainSource() = default;
};

/// A file of this machine, which must outlive the object.
class LocalSource : public PlainSource
{
public:
    explicit LocalSource(const RandomAccessFile& file)
        : mFile(file)
    {
    }

    qint64 size() const override { return mFile.size(); }
    qint64 readAt(qint64 offset, void* bytes, qint64 count) override
    {
        return mFile.readAt(offset, bytes, count);
    }
    bool isUnchanged() override { return mFile.isUnchanged(); }

private:
    const RandomAccessFile& mFile;
};

}  // namespace Kdd
