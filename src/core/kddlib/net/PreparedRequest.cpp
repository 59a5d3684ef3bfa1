#include "kddlib/net/PreparedRequest.h"

#include "kddlib/net/RequestAddress.h"

#include <QByteArray>

#include <algorithm>
#include <utility>

namespace Kdd
{
namespace
{

constexpr qint64 kSmallestLastByte = 1024;

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
        request.url = withSessionId(address, settings.sessionId);
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

std::optional<ByteRange> firstRange(const ClientSettings& settings, qint64 start)
{
    if (settings.numConcurrentRequestsPerFile < 2)
        return std::nullopt;
    return ByteRange{start,
                     start + qMax(qint64(settings.chunkSizeForPartialRequests) - 1, kSmallestLastByte)};
}

}  // namespace Kdd
