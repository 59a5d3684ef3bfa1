#include "server/http/Response.h"

namespace Kdd::Http
{

Response textResponse(int status, const QByteArray& mediaType, const QByteArray& body)
{
    Response response(status);
    response.addHeader("Content-Type", mediaType);
    response.body.emplace_back(body);
    return response;
}

Response failure(int status, const QString& reason)
{
    return textResponse(status, "text/plain; charset=utf-8", reason.toUtf8() + '\n');
}

}  // namespace Kdd::Http
