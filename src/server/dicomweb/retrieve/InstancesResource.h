#pragma once

#include "server/dicomweb/Resource.h"
#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/retrieve/ObjectShelf.h"

namespace Kdd::DicomWeb
{

/// /studies/{s}[/series/{r}[/instances/{i}]]: whole objects as DICOM files with all corrections, as parts, as an archive,
/// one also alone. What cannot be given in a form that the client takes is left out of several, with status 206.
class InstancesResource : public Resource
{
public:
    InstancesResource(std::shared_ptr<StudyShelf> studies, std::shared_ptr<ObjectShelf> objects)
        : mStudies(std::move(studies))
        , mObjects(std::move(objects))
    {
    }

    bool owns(const ResourcePath& path) const override;
    Http::Response answer(const Http::Request& request, const ResourcePath& path) override;

private:
    std::shared_ptr<StudyShelf> mStudies;
    std::shared_ptr<ObjectShelf> mObjects;
};

}  // namespace Kdd::DicomWeb
