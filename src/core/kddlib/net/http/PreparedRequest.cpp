#include "kddlib/net/http/PreparedRequest.h"

#include "kddlib/net/http/ByteRange.h"
#include "kddlib/net/http/RequestAddress.h"
#include "kddlib/net/http/WebOrigin.h"
#include "platform/resources/ExResource.h"

#include <QByteArray>
#include <QList>

#include <algorithm>

namespace Kdd
{
namespace
{

/// Whether the site lets the host of a URL know the session. Whoever holds its id acts as the user, and addresses come
/// from outside.
bool mayKnowSession(const std::string& url)
{
    const QByteArray hosts = ExResource::sessionHosts();
    if (hosts.isEmpty())
        return true;
    const WebOrigin origin = originOf(url);
    const QByteArray host = QByteArray::fromStdString(origin.host);
    const QList<QByteArray> known = QByteArray(hosts).replace(',', ' ').toLower().simplified().split(' ');
    return origin.isValid() &&
           (known.contains(host) || known.contains(host + ':' + QByteArray::fromStdString(origin.port)));
}

bool hasSession(const std::string& url, const std::string& id)
{
    return url.find("?s=" + id) != std::string::npos || url.find("&s=" + id) != std::string::npos;
}

}  // namespace

bool isAuthorised(const PreparedRequest& request)
{
    return std::any_of(request.headers.begin(), request.headers.end(), [](const std::string& line) {
        return qstrnicmp(line.c_str(), "authorization:", 14) == 0;
    });
}

std::string withSession(const std::string& url, const std::string& id)
{
    return id.empty() || !mayKnowSession(url) ? url : withSessionId(url, id);
}

PreparedRequest redirected(PreparedRequest prepared, const std::string& url, bool isSameOrigin,
                           const std::string& sessionId)
{
    const bool hadSession = hasSession(prepared.url, sessionId);
    // Named are the lines that may go along, not those that may not: a caller's own may hold a secret as well.
    if (!isSameOrigin) {
        const auto others =
            std::stable_partition(prepared.headers.begin(), prepared.headers.end(), isRangeHeader);
        prepared.headers.erase(others, prepared.headers.end());
    }
    // The server's own answer may bring it along.
    const bool needsSession = isSameOrigin && hadSession && !hasSession(url, sessionId);
    prepared.url = needsSession ? withSession(url, sessionId) : url;
    return prepared;
}

}  // namespace Kdd
