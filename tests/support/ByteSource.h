#pragma once

#include "platform/volume/KxCompressedDataMedia.h"

#include <QByteArray>
#include <QFile>

#include <cstring>

namespace Kdd
{

/// Bytes in memory as a source that notes how many of them were asked for.
class ByteSource : public MediaSource
{
public:
    explicit ByteSource(const QByteArray& bytes)
        : mBytes(bytes)
    {
    }

    static ByteSource ofFile(const QString& path)
    {
        QFile file(path);
        file.open(QIODevice::ReadOnly);
        return ByteSource(file.readAll());
    }

    const QByteArray& bytes() const { return mBytes; }
    qint64 asked() const { return mAsked; }
    qint64 size() const override { return mBytes.size(); }

    qint64 read(qint64 offset, char* out, qint64 length) override
    {
        const qint64 count = qBound<qint64>(0, mBytes.size() - offset, length);
        std::memcpy(out, mBytes.constData() + offset, static_cast<size_t>(count));
        mAsked += count;
        return count;
    }

private:
    QByteArray mBytes;
    qint64 mAsked = 0;
};

}  // namespace Kdd
