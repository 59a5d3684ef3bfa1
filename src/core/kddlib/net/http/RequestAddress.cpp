#include "kddlib/net/http/RequestAddress.h"

#include "platform/resources/ExResource.h"

#include <algorithm>
#include <cctype>
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

bool isPlain(char c)
{
    return c > ' ' && c < '\x7f' && c != '#';
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

}  // namespace

bool isUrl(const char* name)
{
    return name && (startsWith(name, "http") || startsWith(name, "gs"));
}

std::string webServiceUrl(const std::string& path)
{
    return "https://" + ExResource::getWebServiceHostExternal().toStdString() + "/quil/Browser.svc/" + path;
}

std::string escapedName(std::string_view name)
{
    constexpr char kDigits[] = "0123456789ABCDEF";
    std::string escaped;
    escaped.reserve(name.size());
    for (const char c : name) {
        const auto byte = static_cast<unsigned char>(c);
        if (isPlain(c))
            escaped += c;
        else
            escaped.append(1, '%').append(1, kDigits[byte >> 4]).append(1, kDigits[byte & 15]);
    }
    return escaped;
}

std::string withSessionId(const std::string& url, const std::string& id)
{
    if (id.empty())
        return url;
    // What follows "#" is not sent.
    const std::size_t end = std::min(url.find('#'), url.size());
    const bool hasQuery = url.find('?') < end;
    return url.substr(0, end) + (hasQuery ? "&s=" : "?s=") + id + url.substr(end);
}

bool isCloudAddress(const std::string& address)
{
    return startsWith(address, kCloudScheme);
}

std::string whyNoCloudObject(const std::string& address)
{
    if (!isCloudAddress(address))
        return "names no object of the cloud storage";
    const auto [bucket, object] = namesIn(address);
    if (bucket.empty() || object.empty())
        return "names no object of the cloud storage";
    if (address.find('?') != std::string::npos)
        return "has a \"?\", behind which the name would be cut";
    if (hasBrokenEscape(address))
        return "has a \"%\" without two hexadecimal digits";
    if (!std::all_of(bucket.begin(), bucket.end(), isPlain))
        return "has a bucket that no storage can have";
    if (hasDotFolder(std::string(bucket) + escapedObject(object)))
        return "has a part of dots only, which would lead to another object";
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

}  // namespace Kdd
