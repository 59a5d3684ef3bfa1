#pragma once

#include "server/dicomweb/Resource.h"
#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/retrieve/ObjectShelf.h"

namespace Kdd::DicomWeb
{

/// Pictures for those who show them as they are: ".../rendered" of a study, a series, an instance or some frames.
///
/// As one picture a study or series is shown by its representative image and an instance of many frames by its
/// representative frame; as parts of a multipart answer all images, or all frames, are shown. Documents and videos, which
/// browsers show themselves, are given as they are stored.
class RenderedResource : public Resource
{
public:
    RenderedResource(StudyShelf& studies, ObjectShelf& objects)
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

/// Whether the path ends with the name, behind an object or behind frames.
bool asksFor(const ResourcePath& path, const char* name);

}  // namespace Kdd::DicomWeb
