#pragma once

#include "server/dicomweb/Resource.h"
#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/change/Turns.h"
#include "server/dicomweb/store/ThreadCatalogue.h"

namespace Kdd::DicomWeb
{

/// Removes a study, a series or an instance from the archive. The DICOM files stay where they are.
class RemovalResource : public Resource
{
public:
    /// All outlive the object.
    RemovalResource(const StudyShelf& studies, const ThreadCatalogue& database, Turns& turns)
        : mStudies(studies)
        , mDatabase(database)
        , mTurns(turns)
    {
    }

    bool owns(const ResourcePath& /*path*/) const override { return false; }
    Http::Response answer(const Http::Request& request, const ResourcePath& path) override;
    bool removes(const ResourcePath& path) const override;

    /// 200 with {"study": "1.2", "images": 20, "pending": false}, the images that are gone; 202 when they are still shown;
    /// 404: there is no such thing; 503: others work on the study.
    Http::Response remove(const Http::Request& request, const ResourcePath& path) override;

private:
    const StudyShelf& mStudies;
    const ThreadCatalogue& mDatabase;
    Turns& mTurns;
};

}  // namespace Kdd::DicomWeb
