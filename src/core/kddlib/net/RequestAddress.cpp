#include "kddlib/net/RequestAddress.h"

#include "platform/resources/ExResource.h"

#include <algorithm>
#include <string_view>

namespace Kdd
{
namespace
{

constexpr std::string_view kCloudScheme = "gs:";

bool startsWith(std::string_view text, std::string_view start)
{
    return text.substr(0, start.size()) == start;
}

QByteArray prefixOf(CloudEndpoint endpoint)
{
    switch (endpoint) {
    case CloudEndpoint::Download:
        return ExResource::cloudDownloadEndpoint();
    case CloudEndpoint::Upload:
        return ExResource::cloudUploadEndpoint();
    case CloudEndpoint::Api:
        break;
    }
    return ExResource::cloudApiEndpoint();
}

struct CloudNames
{
    std::string_view bucket;  ///< with the "/" behind it, if there is one
    std::string_view object;
};

CloudNames namesIn(std::string_view address)
{
    address.remove_prefix(kCloudScheme.size());
    address.remove_prefix(std::min(address.find_first_not_of('/'), address.size()));
    const std::size_t bucketEnd = address.find('/');
    const std::size_t objectStart = bucketEnd == std::string_view::npos ? address.size() : bucketEnd + 1;
    return {address.substr(0, objectStart), address.substr(objectStart)};
}

std::string escapedObject(std::string_view name)
{
    std::string escaped;
    for (std::size_t i = 0; i < name.size(); ++i) {
        if (name[i] != '/') {
            escaped += name[i];
            continue;
        }
        escaped += "%2F";
        // Objects were stored under doubled slashes escaped like this, and are found again only so.
        if (++i < name.size())
            escaped += name[i];
    }
    return escaped;
}

}  // namespace

bool isUrl(const char* name)
{
    return name && (startsWith(name, "http") || startsWith(name, "gs"));
}

std::string webServiceUrl(const std::string& path)
{
    return "https://" + ExResource::getWebServiceHostExternal().toStdString() + "/quil/Browser.svc/" + path;
}

std::string withSessionId(const std::string& url, const std::string& id)
{
    if (id.empty())
        return url;
    const bool hasQuery = url.find('?') != std::string::npos;
    return url + (hasQuery ? "&s=" : "?s=") + id;
}

bool isCloudAddress(const std::string& address)
{
    return startsWith(address, kCloudScheme);
}

bool namesCloudObject(const std::string& address)
{
    if (!isCloudAddress(address))
        return false;
    const auto [bucket, object] = namesIn(address);
    return !bucket.empty() && !object.empty();
}

std::string cloudUrl(const std::string& address, CloudEndpoint endpoint)
{
    const auto [bucket, object] = namesIn(address);
    return prefixOf(endpoint).toStdString().append(bucket) + escapedObject(object);
}

std::string cloudApiHost()
{
    const std::string url = ExResource::cloudApiEndpoint().toStdString();
    const std::size_t scheme = url.find("://");
    const std::size_t start = scheme == std::string::npos ? 0 : scheme + 3;
    return url.substr(start, url.find('/', start) - start);
}

}  // namespace Kdd
