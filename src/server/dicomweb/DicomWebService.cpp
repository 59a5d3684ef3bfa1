#include "server/dicomweb/DicomWebService.h"

#include <QString>

namespace Kdd::DicomWeb
{
namespace
{

constexpr const char* kMethods = "GET, HEAD, OPTIONS";

Http::Response methodsOnly(int status)
{
    Http::Response response(status);
    response.addHeader("Allow", kMethods);
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

Http::Response DicomWebService::answer(const Http::Request& request)
{
    ResourcePath path;
    if (!ResourcePath::parse(request.path.mid(mPrefixSegments), path))
        return Http::failure(404, QStringLiteral("No resource has this path"));
    for (const std::unique_ptr<Resource>& resource : mResources) {
        if (!resource->owns(path))
            continue;
        if (request.method == Http::Method::Options)
            return methodsOnly(204);
        if (request.method != Http::Method::Get && request.method != Http::Method::Head)
            return methodsOnly(405);
        return resource->answer(below(request), path);
    }
    return Http::failure(404, QStringLiteral("No resource has this path"));
}

}  // namespace Kdd::DicomWeb
