#include "kddlib/net/http/ObjectVersion.h"

#include "kddlib/net/http/HttpAnswer.h"

namespace Kdd
{
namespace
{

std::string headerOf(const KxHttpStatus& response, const char* name)
{
    const std::string* const value = findHeader(response, name);
    return value ? *value : std::string();
}

}  // namespace

ObjectVersion ObjectVersion::of(const KxHttpStatus& response)
{
    return {headerOf(response, "etag"), headerOf(response, "x-goog-generation"),
            headerOf(response, "last-modified")};
}

bool operator==(const ObjectVersion& a, const ObjectVersion& b)
{
    // Of `b` nothing need be asked: where this counts, the two have the same.
    const bool hasStrong = !a.entityTag.empty() || !a.generation.empty();
    return a.entityTag == b.entityTag && a.generation == b.generation &&
           (hasStrong || a.lastModified == b.lastModified);
}

}  // namespace Kdd
