#pragma once

#include "server/dicomweb/Resource.h"
#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/render/RenderRequest.h"
#include "server/dicomweb/retrieve/ObjectShelf.h"
#include "server/http/AcceptHeader.h"

namespace Kdd::DicomWeb
{

/// Pictures for those who show them as they are: ".../rendered" of a study, a series, an instance or some frames.
///
/// As one picture a study or series is shown by its representative image and an instance of many frames by its
/// representative frame; as parts of a multipart answer all images, or all frames, are shown. A document is shown as it is
/// stored, and a video to those who name a media type of videos.
class RenderedResource : public Resource
{
public:
    RenderedResource(std::shared_ptr<StudyShelf> studies, std::shared_ptr<ObjectShelf> objects)
        : mStudies(std::move(studies))
        , mObjects(std::move(objects))
    {
    }

    bool owns(const ResourcePath& path) const override;
    Http::Response answer(const Http::Request& request, const ResourcePath& path) override;

    /// The same for wishes that do not stand in the request.
    Http::Response show(const Http::Request& request, const Http::AcceptHeader& accept,
                        const RenderRequest& rendering, const ResourcePath& path);

private:
    std::shared_ptr<StudyShelf> mStudies;
    std::shared_ptr<ObjectShelf> mObjects;
};

/// Whether the path ends with the name, behind an object or behind frames.
bool asksFor(const ResourcePath& path, const char* name);

}  // namespace Kdd::DicomWeb
