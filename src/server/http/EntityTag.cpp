#include "server/http/EntityTag.h"

#include <QList>

namespace Kdd::Http
{

bool hasEntity(const Request& request, const QByteArray& tag, AnyTag any)
{
    const QList<QByteArray> held = request.header("if-none-match").split(',');
    for (const QByteArray& each : held) {
        const QByteArray text = each.trimmed();
        const bool isAny = any == AnyTag::Counts && text == "*";
        if (!tag.isEmpty() && (text == tag || text == "W/" + tag || isAny))
            return true;
    }
    return false;
}

Response notModified(const QByteArray& tag, const QByteArray& vary)
{
    Response response(304);
    addEntityTag(tag, response, vary);
    return response;
}

void addEntityTag(const QByteArray& tag, Response& response, const QByteArray& vary)
{
    if (!tag.isEmpty())
        response.addHeader("ETag", tag);
    response.addHeader("Vary", vary);
    response.addHeader("Cache-Control", "private, no-cache");
}

}  // namespace Kdd::Http
