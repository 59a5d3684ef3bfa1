#include "server/dicomweb/retrieve/ValueAnswer.h"

#include "server/http/EntityTag.h"
#include "server/http/RangeHeader.h"

namespace Kdd::DicomWeb
{

Http::Response alone(const Http::Request& request, const BulkValue& value, const QByteArray& contentType)
{
    if (Http::hasEntity(request, value.etag))
        return Http::notModified(value.etag);
    const qint64 length = value.length();
    const Http::WantedBytes wanted = Http::wantedBytes(request, length, value.etag);
    const QByteArray size = QByteArray::number(length);
    if (wanted.kind == Http::WantedBytes::Kind::Impossible) {
        Http::Response refused = Http::failure(416, QStringLiteral("The value has %1 bytes").arg(length));
        refused.addHeader("Content-Range", "bytes */" + size);
        return refused;
    }
    Http::Response response;
    response.addHeader("Content-Type", contentType);
    response.addHeader("Accept-Ranges", "bytes");
    Http::addEntityTag(value.etag, response);
    if (wanted.kind == Http::WantedBytes::Kind::Part) {
        response.status = 206;
        response.addHeader("Content-Range", "bytes " + QByteArray::number(wanted.offset) + '-' +
                                                QByteArray::number(wanted.offset + wanted.length - 1) + '/' +
                                                size);
    }
    value.append(wanted.offset, wanted.length, response.body);
    return response;
}

}  // namespace Kdd::DicomWeb
