#pragma once

#include "server/dicomweb/Resource.h"
#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/metadata/KeptAnswers.h"
#include "server/dicomweb/metadata/MetadataRequest.h"

namespace Kdd::DicomWeb
{

/// The attributes of a study's images, of a series' or of one image, from the tag file: as DICOM JSON or as XML of the
/// Native DICOM Model, all or, by `includefield`, some of them. Compressed answers about many images are kept. Each
/// answer carries an entity tag that changes with the tag file.
class MetadataResource : public Resource
{
public:
    /// The shelf must outlive this, and this the answers.
    MetadataResource(StudyShelf& studies, const QString& keptFolder, qint64 keptCapacity)
        : mStudies(studies)
        , mKept(keptFolder, keptCapacity)
    {
    }

    bool owns(const ResourcePath& path) const override;
    Http::Response answer(const Http::Request& request, const ResourcePath& path) override;

    /// Of the answers about several images for clients that take them compressed.
    const Http::CacheCount& keptCount() const { return mKept.count(); }

private:
    Http::Response look(const Http::Request& request, const MetadataRequest& metadata, Presence& presence);
    Http::Response answerFrom(std::shared_ptr<const ServedStudy> study, const Http::Request& request,
                              const MetadataRequest& metadata);

    StudyShelf& mStudies;
    KeptAnswers mKept;
};

}  // namespace Kdd::DicomWeb
