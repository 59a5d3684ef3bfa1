#include "kddlib/net/http/PreparedRequest.h"

#include "kddlib/net/http/RequestAddress.h"
#include "kddlib/net/http/WebOrigin.h"
#include "platform/resources/ExResource.h"

#include <QByteArray>
#include <QList>

#include <algorithm>
#include <utility>

namespace Kdd
{
namespace
{

constexpr qint64 kSmallestLastByte = 1024;

/// Whether the site lets the host of a URL know the session.
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

std::string withSession(const std::string& url, const std::string& id)
{
    return id.empty() || !mayKnowSession(url) ? url : withSessionId(url, id);
}

bool hasSession(const std::string& url, const std::string& id)
{
    return url.find("?s=" + id) != std::string::npos || url.find("&s=" + id) != std::string::npos;
}

}  // namespace

std::string authorizationHeader(const ClientSettings& settings)
{
    return settings.authorization ? settings.authorization() : std::string();
}

std::vector<std::string> cloudHeaders(const std::string& authorization)
{
    return {authorization, "Host: " + cloudApiHost(), "Cache-Control: no-transform"};
}

bool isAuthorised(const PreparedRequest& request)
{
    return std::any_of(request.headers.begin(), request.headers.end(), [](const std::string& line) {
        return qstrnicmp(line.c_str(), "authorization:", 14) == 0;
    });
}

PreparedRequest prepareRequest(const std::string& address, std::vector<std::string> headers, RequestBody body,
                               const ClientSettings& settings)
{
    PreparedRequest request;
    request.headers = std::move(headers);
    // Without it curl would wait for the server's leave before it sends a longer body.
    if (body == RequestBody::Sent)
        request.headers.emplace_back("Expect: ");
    if (!isCloudAddress(address)) {
        request.url = withSession(address, settings.sessionId);
        return request;
    }
    request.url =
        cloudUrl(address, body == RequestBody::Sent ? CloudEndpoint::Upload : CloudEndpoint::Download);
    const std::string authorization = authorizationHeader(settings);
    if (!authorization.empty()) {
        for (std::string& line : cloudHeaders(authorization))
            request.headers.push_back(std::move(line));
    }
    return request;
}

PreparedRequest redirected(PreparedRequest prepared, const std::string& url, bool isSameOrigin,
                           const ClientSettings& settings)
{
    const bool hadSession = hasSession(prepared.url, settings.sessionId);
    if (!isSameOrigin) {
        const auto others =
            std::stable_partition(prepared.headers.begin(), prepared.headers.end(), isRangeHeader);
        prepared.headers.erase(others, prepared.headers.end());
    }
    // The server's own answer may bring it along.
    const bool needsSession = isSameOrigin && hadSession && !hasSession(url, settings.sessionId);
    prepared.url = needsSession ? withSession(url, settings.sessionId) : url;
    return prepared;
}

std::optional<ByteRange> firstRange(const ClientSettings& settings, qint64 start)
{
    if (settings.numConcurrentRequestsPerFile < 2)
        return std::nullopt;
    return ByteRange{start,
                     start + qMax(qint64(settings.chunkSizeForPartialRequests) - 1, kSmallestLastByte)};
}

}  // namespace Kdd
