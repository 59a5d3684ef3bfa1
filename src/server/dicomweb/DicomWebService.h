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

    /// 404 for a path that nothing owns, 405 for methods other than GET, HEAD and OPTIONS, and POST where something
    /// receives.
    Http::Response answer(const Http::Request& request) override;

private:
    Http::Request below(const Http::Request& request) const;
    Resource* receiver(const ResourcePath& path) const;

    int mPrefixSegments;
    std::vector<std::unique_ptr<Resource>> mResources;
};

}  // namespace Kdd::DicomWeb
