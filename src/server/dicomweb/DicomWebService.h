#pragma once

#include "server/dicomweb/Resource.h"

#include <memory>
#include <vector>

namespace Kdd::DicomWeb
{

/// DICOMweb below its prefix: finds the resource that answers for a path.
class DicomWebService : public Http::Handler
{
public:
    /// `prefixSegments` is how many segments of each path lead here.
    DicomWebService(int prefixSegments, std::vector<std::unique_ptr<Resource>> resources);

    /// 404 for a path that nothing owns, 405 for methods other than GET, HEAD and OPTIONS, but for POST where something
    /// receives and DELETE where something removes.
    Http::Response answer(const Http::Request& request) override;

private:
    Http::Request below(const Http::Request& request) const;
    Resource* find(bool (Resource::*can)(const ResourcePath&) const, const ResourcePath& path) const;

    int mPrefixSegments;
    std::vector<std::unique_ptr<Resource>> mResources;
};

}  // namespace Kdd::DicomWeb
