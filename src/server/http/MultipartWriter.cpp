#include "server/http/MultipartWriter.h"

#include <QRandomGenerator>

namespace Kdd::Http
{

namespace
{

/// 160 random bits: whoever fills a body cannot guess them either.
QByteArray randomBoundary()
{
    quint32 words[5];
    QRandomGenerator::system()->fillRange(words);
    return QByteArray(reinterpret_cast<const char*>(words), sizeof words).toHex();
}

}  // namespace

MultipartWriter::MultipartWriter(const QByteArray& type)
    : mType(type)
    , mBoundary(randomBoundary())
{
}

QByteArray MultipartWriter::mediaType() const
{
    return "multipart/related; type=\"" + mType + "\"; boundary=" + mBoundary;
}

/// Names are for archives; here the order tells. A location, where one is given, is where the part can be had alone.
QByteArray MultipartWriter::begin(const QByteArray& name, const QByteArray& mediaType)
{
    const QByteArray location = name.isEmpty() ? QByteArray() : "\r\nContent-Location: " + name;
    return "--" + mBoundary + "\r\nContent-Type: " + mediaType + location + "\r\n\r\n";
}

QByteArray MultipartWriter::finish()
{
    return "--" + mBoundary + "--\r\n";
}

}  // namespace Kdd::Http
