#pragma once

#include "server/dicomweb/StudyShelf.h"
#include "server/dicomweb/change/JobText.h"
#include "server/dicomweb/change/Turns.h"
#include "server/dicomweb/search/StudySight.h"
#include "server/http/Response.h"

#include <kddlib/QAData.h>

namespace Kdd::DicomWeb
{

/// What is known of a correction before its job comes.
struct CorrectionOrder
{
    QByteArray root;    ///< address of DICOMweb
    QByteArray study;   ///< that it was sent to
    QByteArray caller;  ///< empty: whoever the job names
    QByteArray id;      ///< of the request, for the log
    JobForm form = JobForm::Json;
    bool isPreview = false;
    QList<QByteArray> images;  ///< that the address names, beside those of the job
    QList<QByteArray> series;
    bool isOfWholeStudy = false;
    StudySight::Limits limits;  ///< of the caller
};

/// Takes the job of one request, and corrects when it has come.
class CorrectionBody final : public Http::BodySink
{
public:
    /// `studies`, `sight` and `turns` outlive the object.
    CorrectionBody(StudyShelf& studies, const StudySight& sight, Turns& turns, CorrectionOrder order)
        : mStudies(studies)
        , mSight(sight)
        , mTurns(turns)
        , mOrder(std::move(order))
    {
    }

    bool take(const char* bytes, int size) override;

    /// 200 with `correctionReport`; 400: it is no job; 403: it would move images out of or into a study that the caller may
    /// not see; 404, with the report, when none of its images is there; 409: it
    /// cannot be done; 413; 503: others work on the study.
    Http::Response answer() override;

private:
    bool complete(QString& reason);
    bool mayMove() const;
    Http::Response correct();
    Http::Response failed(const Result& result) const;
    void expect(const Result& reason) const;

    StudyShelf& mStudies;
    const StudySight& mSight;
    Turns& mTurns;
    const CorrectionOrder mOrder;
    QByteArray mText;
    QAData mJob;
};

/// A name as audit logs can hold it, in Latin-1: every other character by its number ("\u0416").
QByteArray loginOf(const QByteArray& caller);

}  // namespace Kdd::DicomWeb
