#pragma once

#include "server/dicomweb/Resource.h"
#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/retrieve/ObjectShelf.h"

namespace Kdd::DicomWeb
{

/// .../instances/{i}/frames/{1,2,...}: frames of an image, each as it lies in its file or decoded.
class FramesResource : public Resource
{
public:
    /// Both must outlive the resource.
    FramesResource(StudyShelf& studies, ObjectShelf& objects)
        : mStudies(studies)
        , mObjects(objects)
    {
    }

    bool owns(const ResourcePath& path) const override;
    Http::Response answer(const Http::Request& request, const ResourcePath& path) override;

private:
    StudyShelf& mStudies;
    ObjectShelf& mObjects;
};

}  // namespace Kdd::DicomWeb
