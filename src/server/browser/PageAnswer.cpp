#include "server/browser/PageAnswer.h"

#include "server/browser/PageFile.h"
#include "server/http/AcceptHeader.h"
#include "server/http/Compression.h"
#include "server/http/GzipEncoder.h"

#include <QCryptographicHash>
#include <QJsonDocument>

namespace Kdd::Browser
{
namespace
{

Http::Response marked(int status, const QByteArray& etag)
{
    Http::Response response(status);
    response.addHeader("ETag", etag);
    // May be kept, but is asked for again each time: a correction shows at once.
    response.addHeader("Cache-Control", "private, no-cache");
    return response;
}

Http::Response answer(const Http::Request& request, const QByteArray& etag, const QByteArray& mediaType,
                      const QByteArray& body)
{
    if (isKnown(request, etag))
        return marked(304, etag);
    Http::Response response = marked(200, etag);
    response.addHeader("Content-Type", mediaType);
    response.body.emplace_back(body);
    return response;
}

}  // namespace

bool isKnown(const Http::Request& request, const QByteArray& etag)
{
    for (const QByteArray& one : request.header("if-none-match").split(',')) {
        QByteArray known = one.trimmed();
        // Compressed on the way it is weak.
        if (known.startsWith("W/"))
            known.remove(0, 2);
        if (known == "*" || known == etag)
            return true;
    }
    return false;
}

Http::Response pageAnswer(const Http::Request& request, const QByteArray& name)
{
    const PageFile* file = findPageFile(name);
    if (file == nullptr)
        return Http::failure(404, QStringLiteral("The page has no such file"));
    const auto bytes = [](const unsigned char* content, int size) {
        return QByteArray::fromRawData(reinterpret_cast<const char*>(content), size);
    };
    const bool isCompressed = Http::acceptsCoding(request, "gzip");
    // Two forms are two states.
    const QByteArray etag = '"' + QByteArray(file->digest) + (isCompressed ? "-gzip\"" : "\"");
    Http::Response response = answer(request, etag, file->mediaType,
                                     isCompressed ? bytes(file->compressed, file->compressedSize)
                                                  : bytes(file->content, file->size));
    response.addHeader("Vary", "Accept-Encoding");
    if (isCompressed && response.status == 200)
        response.addHeader("Content-Encoding", "gzip");
    return response;
}

Http::Response jsonAnswer(const Http::Request& request, const QJsonObject& object)
{
    const QByteArray body = QJsonDocument(object).toJson(QJsonDocument::Compact);
    const QByteArray digest = QCryptographicHash::hash(body, QCryptographicHash::Sha256).toHex().left(32);
    const bool isCompressed = Http::isWorthCompressing(request, body.size());
    const QByteArray etag = '"' + digest + (isCompressed ? "-gzip\"" : "\"");
    Http::Response response = isKnown(request, etag) ? marked(304, etag)
                                                     : answer(request, etag, "application/json",
                                                              isCompressed ? Http::gzipped(body) : body);
    response.addHeader("Vary", "Accept-Encoding");
    if (isCompressed && response.status == 200)
        response.addHeader("Content-Encoding", "gzip");
    return response;
}

Http::Response pictureAnswer(const Http::Request& request, const QByteArray& jpeg, const QByteArray& etag)
{
    return answer(request, etag, "image/jpeg", jpeg);
}

}  // namespace Kdd::Browser
