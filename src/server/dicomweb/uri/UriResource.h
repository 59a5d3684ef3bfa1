#pragma once

#include "server/dicomweb/Resource.h"
#include "server/dicomweb/render/RenderedResource.h"
#include "server/dicomweb/retrieve/InstancesResource.h"

namespace Kdd::DicomWeb
{

struct UriRequest;

/// One instance by parameters, /wado?requestType=WADO&studyUID=...&seriesUID=...&objectUID=..., for viewers that are
/// older than paths. Whatever it answers the resources of those paths give.
class UriResource : public Resource
{
public:
    UriResource(const std::shared_ptr<StudyShelf>& studies, const std::shared_ptr<ObjectShelf>& objects)
        : mStudies(studies)
        , mInstances(studies, objects)
        , mRendered(studies, objects)
    {
    }

    bool owns(const ResourcePath& path) const override;
    Http::Response answer(const Http::Request& request, const ResourcePath& path) override;

private:
    Http::Response asObject(const Http::Request& request, const UriRequest& wanted);

    std::shared_ptr<StudyShelf> mStudies;
    InstancesResource mInstances;
    RenderedResource mRendered;
};

}  // namespace Kdd::DicomWeb
