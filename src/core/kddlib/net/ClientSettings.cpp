#include "kddlib/net/ClientSettings.h"

#include "kddlib/net/cloud/CloudAddress.h"

#include <utility>

namespace Kdd
{
namespace
{

/// To ask for a shorter range costs more than it spares.
constexpr qint64 kSmallestLastByte = 1024;

}  // namespace

std::string authorizationHeader(const ClientSettings& settings)
{
    return settings.authorization ? settings.authorization() : std::string();
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
    // The session is the own service's secret: the provider of the storage is never told it.
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
