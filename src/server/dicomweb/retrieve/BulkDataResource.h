#pragma once

#include "server/dicomweb/Resource.h"
#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/retrieve/ImageFinder.h"
#include "server/dicomweb/retrieve/ObjectShelf.h"
#include "server/http/AcceptHeader.h"

namespace Kdd::DicomWeb
{

/// .../instances/{i}/bulkdata/KEY[/ITEM/KEY...]: one value, whole or a range of it; .../bulkdata and .../pixeldata of a
/// study, a series or an instance: all values that metadata leave out, or the pixels.
class BulkDataResource : public Resource
{
public:
    BulkDataResource(std::shared_ptr<StudyShelf> studies, std::shared_ptr<ObjectShelf> objects)
        : mStudies(std::move(studies))
        , mObjects(std::move(objects))
    {
    }

    bool owns(const ResourcePath& path) const override;
    Http::Response answer(const Http::Request& request, const ResourcePath& path) override;

private:
    Http::Response answerAll(const Http::AcceptHeader& accept, const ResourcePath& path,
                             const std::shared_ptr<const ServedStudy>& study,
                             const QVector<ListedImage>& images);

    std::shared_ptr<StudyShelf> mStudies;
    std::shared_ptr<ObjectShelf> mObjects;
};

}  // namespace Kdd::DicomWeb
