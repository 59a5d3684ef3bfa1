#include "server/dicomweb/DicomWebService.h"

#include <QString>

#include <algorithm>

namespace Kdd::DicomWeb
{
namespace
{

Http::Response methodsOnly(int status, bool canPost)
{
    Http::Response response(status);
    response.addHeader("Allow", canPost ? "GET, HEAD, OPTIONS, POST" : "GET, HEAD, OPTIONS");
    return response;
}

}  // namespace

DicomWebService::DicomWebService(int prefixSegments, std::vector<std::unique_ptr<Resource>> resources)
    : mPrefixSegments(prefixSegments)
    , mResources(std::move(resources))
{
}

Http::Request DicomWebService::below(const Http::Request& request) const
{
    Http::Request made = request;
    for (const QByteArray& segment : request.path.mid(0, mPrefixSegments))
        made.base += '/' + segment;
    return made;
}

/// Null when nothing can be sent there.
Resource* DicomWebService::receiver(const ResourcePath& path) const
{
    const auto found = std::find_if(mResources.begin(), mResources.end(),
                                    [&](const auto& resource) { return resource->receives(path); });
    return found == mResources.end() ? nullptr : found->get();
}

Http::Response DicomWebService::answer(const Http::Request& request)
{
    ResourcePath path;
    if (!ResourcePath::parse(request.path.mid(mPrefixSegments), path))
        return Http::failure(404, QStringLiteral("No resource has this path"));
    Resource* const receiving = receiver(path);
    if (request.method == Http::Method::Post && receiving != nullptr)
        return receiving->receive(below(request), path);
    for (const std::unique_ptr<Resource>& resource : mResources) {
        if (!resource->owns(path))
            continue;
        if (request.method == Http::Method::Options)
            return methodsOnly(204, receiving != nullptr);
        if (request.method != Http::Method::Get && request.method != Http::Method::Head)
            return methodsOnly(405, receiving != nullptr);
        return resource->answer(below(request), path);
    }
    return Http::failure(404, QStringLiteral("No resource has this path"));
}

}  // namespace Kdd::DicomWeb
