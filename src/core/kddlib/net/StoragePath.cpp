#include "kddlib/net/StoragePath.h"

#include "kddlib/net/RequestAddress.h"

#include <algorithm>
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

StoragePath parse(std::string name)
{
    std::replace(name.begin(), name.end(), '\\', '/');
    for (const std::string_view prefix : {"/Storage/", "//"}) {
        if (name.compare(0, prefix.size(), prefix) != 0)
            continue;
        const std::size_t end = name.find('/', prefix.size());
        if (end == std::string::npos || end == prefix.size())
            break;
        return {name.substr(prefix.size(), end - prefix.size()), name.substr(end)};
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
