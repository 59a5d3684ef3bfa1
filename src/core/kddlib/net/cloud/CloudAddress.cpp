#include "kddlib/net/cloud/CloudAddress.h"

#include "kddlib/net/http/RequestAddress.h"
#include "platform/resources/ExResource.h"

#include <algorithm>
#include <cctype>
#include <string_view>

namespace Kdd
{
namespace
{

constexpr std::string_view kScheme = "gs:";

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

/// Any number of "/" may stand behind the scheme, as in "gs://".
CloudNames namesIn(std::string_view address)
{
    address.remove_prefix(kScheme.size());
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
            escaped += escapedName(name.substr(i, 1));
            continue;
        }
        escaped += "%2F";
        // Objects were stored under doubled slashes escaped like this, and are found again only so.
        if (++i < name.size())
            escaped += escapedName(name.substr(i, 1));
    }
    return escaped;
}

bool hasBrokenEscape(std::string_view name)
{
    const auto isHexDigit = [&](std::size_t at) {
        return at < name.size() && std::isxdigit(static_cast<unsigned char>(name[at])) != 0;
    };
    for (std::size_t i = name.find('%'); i != std::string_view::npos; i = name.find('%', i + 1)) {
        if (!isHexDigit(i + 1) || !isHexDigit(i + 2))
            return true;
    }
    return false;
}

/// Whether a part between two "/" is "." or "..", escaped or not, which servers resolve into another path.
bool hasDotFolder(std::string_view path)
{
    for (std::size_t start = 0; start <= path.size();) {
        const std::size_t end = std::min(path.find('/', start), path.size());
        std::string part(path.substr(start, end - start));
        // Servers unescape before they resolve, so an escaped dot is one.
        for (const char* const dot : {"%2e", "%2E"}) {
            for (std::size_t at = 0; (at = part.find(dot)) != std::string::npos;)
                part.replace(at, 3, ".");
        }
        if (part == "." || part == "..")
            return true;
        start = end + 1;
    }
    return false;
}

Result refusal(const char* reason)
{
    return Result::failure(QString::fromLatin1(reason));
}

}  // namespace

bool isCloudAddress(const std::string& address)
{
    return address.compare(0, kScheme.size(), kScheme) == 0;
}

Result checkCloudObject(const std::string& address)
{
    const auto [bucket, object] = isCloudAddress(address) ? namesIn(address) : CloudNames();
    if (bucket.empty() || object.empty())
        return refusal("names no object of the cloud storage");
    if (address.find('?') != std::string::npos)
        return refusal("has a \"?\", behind which the name would be cut");
    if (hasBrokenEscape(address))
        return refusal("has a \"%\" without two hexadecimal digits");
    if (escapedName(bucket) != bucket)
        return refusal("has a bucket that no storage can have");
    if (hasDotFolder(std::string(bucket) + escapedObject(object)))
        return refusal("has a part of dots only, which would lead to another object");
    return {};
}

std::string cloudUrl(const std::string& address, CloudEndpoint endpoint)
{
    const auto [bucket, object] = namesIn(address);
    return prefixOf(endpoint).toStdString() + escapedName(bucket) + escapedObject(object);
}

std::string cloudApiHost()
{
    const std::string url = ExResource::cloudApiEndpoint().toStdString();
    const std::size_t scheme = url.find("://");
    const std::size_t start = scheme == std::string::npos ? 0 : scheme + 3;
    return url.substr(start, url.find('/', start) - start);
}

std::vector<std::string> cloudHeaders(const std::string& authorization)
{
    return {authorization, "Host: " + cloudApiHost(), "Cache-Control: no-transform"};
}

}  // namespace Kdd
