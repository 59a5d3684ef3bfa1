#pragma once

#include "platform/base/Result.h"
#include "platform/os/RandomAccessFile.h"
#include "platform/volumefile/FileDriver.h"

#include <QByteArray>

namespace Kdd::VolumeFile
{

/// Bytes that are only read. Files are whole before they get their names, so nothing is locked.
class ReadStore : public ByteStore
{
public:
    bool write(qint64 at, const void* bytes, std::size_t size) override;
    bool truncate(qint64 size) override;
};

class FileToRead final : public ReadStore
{
public:
    /// To be called once.
    Result open(const QByteArray& path);

    qint64 size() const override { return mFile.size(); }
    bool read(qint64 at, void* bytes, std::size_t size) override;

private:
    RandomAccessFile mFile;
};

class BytesToRead final : public ReadStore
{
public:
    /// `bytes` stay shared.
    explicit BytesToRead(QByteArray bytes);

    qint64 size() const override { return mBytes.size(); }
    bool read(qint64 at, void* bytes, std::size_t size) override;

private:
    QByteArray mBytes;
};

}  // namespace Kdd::VolumeFile
