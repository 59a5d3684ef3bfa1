#pragma once

#include "server/dicomweb/ResourcePath.h"
#include "server/http/Response.h"

namespace Kdd::DicomWeb
{

/// What answers for one group of paths. Called on several threads at the same time.
class Resource
{
public:
    virtual ~Resource() = default;

    /// Whether the path is this one's.
    virtual bool owns(const ResourcePath& path) const = 0;

    /// The answer to GET (and HEAD) on a path that is owned. The request's base is the address of DICOMweb, with its
    /// prefix: an object's is base + "/studies/1.2".
    virtual Http::Response answer(const Http::Request& request, const ResourcePath& path) = 0;

    /// Whether something can be sent to the path, which need not be one that is owned.
    virtual bool receives(const ResourcePath& /*path*/) const { return false; }

    /// The answer to POST on such a path, given before the body: with a sink for that, or why it is not wanted.
    virtual Http::Response receive(const Http::Request& /*request*/, const ResourcePath& /*path*/)
    {
        return Http::Response(405);
    }

    /// Whether what the path names can be removed.
    virtual bool removes(const ResourcePath& /*path*/) const { return false; }

    /// The answer to DELETE on such a path, once it is done.
    virtual Http::Response remove(const Http::Request& /*request*/, const ResourcePath& /*path*/)
    {
        return Http::Response(405);
    }
};

}  // namespace Kdd::DicomWeb
