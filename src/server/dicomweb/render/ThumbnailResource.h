#pragma once

#include "server/dicomweb/Resource.h"
#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/retrieve/ObjectShelf.h"

namespace Kdd::DicomWeb
{

/// Small pictures for lists: ".../thumbnail" of a study, a series, an instance or a frame. From the previews that the tag
/// file holds; drawn from the DICOM file only for an image that has none of its own.
class ThumbnailResource : public Resource
{
public:
    ThumbnailResource(std::shared_ptr<StudyShelf> studies, std::shared_ptr<ObjectShelf> objects)
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
