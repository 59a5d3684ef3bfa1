#include "server/dicomweb/DicomWebService.h"

#include <QString>

#include <algorithm>

namespace Kdd::DicomWeb
{
namespace
{

Http::Response methodsOnly(int status, bool canPost, bool canDelete)
{
    Http::Response response(status);
    response.addHeader("Allow", QByteArray("GET, HEAD, OPTIONS") + (canPost ? ", POST" : "") +
                                    (canDelete ? ", DELETE" : ""));
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

/// The first that can do that with what the path names; null: none.
Resource* DicomWebService::find(bool (Resource::*can)(const ResourcePath&) const,
                                const ResourcePath& path) const
{
    const auto found = std::find_if(mResources.begin(), mResources.end(),
                                    [&](const auto& resource) { return ((*resource).*can)(path); });
    return found == mResources.end() ? nullptr : found->get();
}

Http::Response DicomWebService::answer(const Http::Request& request)
{
    ResourcePath path;
    if (!ResourcePath::parse(request.path.mid(mPrefixSegments), path))
        return Http::failure(404, QStringLiteral("No resource has this path"));
    Resource* const receiving = find(&Resource::receives, path);
    Resource* const removing = find(&Resource::removes, path);
    if (request.method == Http::Method::Post && receiving != nullptr)
        return receiving->receive(below(request), path);
    if (request.method == Http::Method::Delete && removing != nullptr)
        return removing->remove(below(request), path);
    Resource* const owner = find(&Resource::owns, path);
    if (owner == nullptr)
        return Http::failure(404, QStringLiteral("No resource has this path"));
    if (request.method == Http::Method::Get || request.method == Http::Method::Head)
        return owner->answer(below(request), path);
    return methodsOnly(request.method == Http::Method::Options ? 204 : 405, receiving != nullptr,
                       removing != nullptr);
}

}  // namespace Kdd::DicomWeb
