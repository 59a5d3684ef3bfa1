#include "kddlib/net/http/RequestAddress.h"

#include "platform/resources/ExResource.h"

#include <algorithm>

namespace Kdd
{
namespace
{

bool isPlain(char c)
{
    return c > ' ' && c < '\x7f' && c != '#';
}

}  // namespace

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

}  // namespace Kdd
