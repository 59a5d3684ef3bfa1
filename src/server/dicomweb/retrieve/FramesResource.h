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
    FramesResource(std::shared_ptr<StudyShelf> studies, std::shared_ptr<ObjectShelf> objects)
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
