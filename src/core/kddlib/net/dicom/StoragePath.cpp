#include "kddlib/net/dicom/StoragePath.h"

#include "kddlib/net/http/RequestAddress.h"

#include <algorithm>
#include <cctype>
#include <string_view>

namespace Kdd
{
namespace
{

struct StoragePath
{
    std::string host;
    std::string rest;  // from the "/" on that ends the host; empty when the name has another form
};

/// Anything else would be taken for a port, a user or the end of the host.
bool isHost(std::string_view text)
{
    const auto isLetter = [](char c) {
        const auto byte = static_cast<unsigned char>(c);
        return std::isalnum(byte) != 0 || byte >= 0x80 || c == '-' || c == '.' || c == '_';
    };
    const bool isNumeric = text.size() > 2 && text.front() == '[' && text.back() == ']';
    if (isNumeric)
        return text.find_first_not_of("0123456789abcdefABCDEF:.", 1) == text.size() - 1;
    return !text.empty() && std::all_of(text.begin(), text.end(), isLetter);
}

/// Names come from systems of both kinds, so both separators are taken.
StoragePath parse(std::string name)
{
    std::replace(name.begin(), name.end(), '\\', '/');
    for (const std::string_view prefix : {"/Storage/", "//"}) {
        if (name.compare(0, prefix.size(), prefix) != 0)
            continue;
        const std::size_t end = name.find('/', prefix.size());
        if (end == std::string::npos)
            break;
        const std::string host = name.substr(prefix.size(), end - prefix.size());
        // No other prefix can fit: a name that begins so is of this form or of none.
        if (!isHost(host))
            break;
        return {host, escapedName(std::string_view(name).substr(end))};
    }
    return {};
}

}  // namespace

std::string storageUrl(const std::string& name, const std::string& port)
{
    const StoragePath path = parse(name);
    return path.rest.empty() ? std::string() : "http://" + path.host + ':' + port + path.rest;
}

std::string externalStorageUrl(const std::string& name)
{
    const StoragePath path = parse(name);
    return path.rest.empty() ? std::string() : webServiceUrl(path.rest.substr(1));
}

}  // namespace Kdd
