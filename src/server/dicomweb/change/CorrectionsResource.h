#pragma once

#include "server/dicomweb/Resource.h"
#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/change/Turns.h"

namespace Kdd::DicomWeb
{

/// `studies/{s}/corrections`: what was corrected in a study, and corrections to be made.
class CorrectionsResource : public Resource
{
public:
    /// Both outlive the object.
    CorrectionsResource(StudyShelf& studies, Turns& turns)
        : mStudies(studies)
        , mTurns(turns)
    {
    }

    bool owns(const ResourcePath& path) const override;

    /// The study's history, as JSON or CSV (`CorrectionHistory`).
    Http::Response answer(const Http::Request& request, const ResourcePath& path) override;

    bool receives(const ResourcePath& path) const override;

    /// A job: see `CorrectionBody`. The parameters `image` and `series` (a list of UIDs, may be repeated) and `all=true` tell
    /// of which images; with `preview=true` it is only told what would be done. 400, 406, 415 for what cannot be one.
    Http::Response receive(const Http::Request& request, const ResourcePath& path) override;

private:
    StudyShelf& mStudies;
    Turns& mTurns;
};

}  // namespace Kdd::DicomWeb
