#include "server/http/EntityTag.h"

#include <QList>

namespace Kdd::Http
{

bool hasEntity(const Request& request, const QByteArray& tag)
{
    const QList<QByteArray> held = request.header("if-none-match").split(',');
    for (const QByteArray& each : held) {
        const QByteArray text = each.trimmed();
        if (!tag.isEmpty() && (text == tag || text == "W/" + tag || text == "*"))
            return true;
    }
    return false;
}

Response notModified(const QByteArray& tag)
{
    Response response(304);
    addEntityTag(tag, response);
    return response;
}

void addEntityTag(const QByteArray& tag, Response& response)
{
    if (!tag.isEmpty())
        response.addHeader("ETag", tag);
    response.addHeader("Vary", "Accept");
    response.addHeader("Cache-Control", "private, no-cache");
}

}  // namespace Kdd::Http
