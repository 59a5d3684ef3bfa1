#include "server/dicomweb/change/CorrectionBody.h"

#include "server/dicomweb/ResourcePath.h"
#include "server/dicomweb/change/ChangeAnswer.h"
#include "server/dicomweb/change/CorrectionReport.h"
#include "server/dicomweb/change/ObjectName.h"

#include <QSet>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <kddlib/Limits.h>
#include <kddlib/LogFile.h>
#include <kddlib/StudyChange.h>

#include <algorithm>

namespace Kdd::DicomWeb
{

QByteArray loginOf(const QByteArray& caller)
{
    QByteArray login;
    for (const QChar c : QString::fromUtf8(caller)) {
        if (c.unicode() < 0x100 && c.isPrint() && c != QLatin1Char('\\'))
            login += c.toLatin1();
        else
            login += QStringLiteral("\\u%1").arg(c.unicode(), 4, 16, QLatin1Char('0')).toLatin1();
    }
    return login.trimmed();
}

bool CorrectionBody::take(const char* bytes, int size)
{
    mText.append(bytes, size);
    return mText.size() <= kMaxJobXml;
}

Http::Response CorrectionBody::answer()
{
    if (mText.size() > kMaxJobXml)
        return Http::failure(413, QStringLiteral("The job is larger than %1 bytes").arg(kMaxJobXml));
    QString reason;
    if (!readJob(mText, mOrder.form, mJob, reason) || !complete(reason))
        return Http::failure(400, reason);
    if (!mayMove())
        return Http::failure(403, QStringLiteral("Images may not be moved between these studies"));
    const Turn turn(mTurns);
    return turn ? correct() : tooManyChanges();
}

/// Adds what the address and the caller say to what the job does.
bool CorrectionBody::complete(QString& reason)
{
    mJob.studyUID = mOrder.study;
    // Who is known cannot be somebody else.
    if (!mOrder.caller.isEmpty())
        mJob.login = loginOf(mOrder.caller);
    mJob.images += mOrder.images;
    mJob.series += mOrder.series;
    mJob.isOfWholeStudy = mJob.isOfWholeStudy || mOrder.isOfWholeStudy;
    if (mJob.images.isEmpty() && mJob.series.isEmpty() && !mJob.isOfWholeStudy) {
        reason = QStringLiteral("It is not said which images are meant: image=UID, series=UID or all=true");
        return false;
    }
    // It names a file: what is none must not lead anywhere.
    if (!mJob.oldStudyUID.isEmpty() && !isUID(mJob.oldStudyUID)) {
        reason = QStringLiteral("OldSUID is no UID");
        return false;
    }
    // Another Study Instance UID for images of this study is a move from here to there.
    const auto isOtherStudy = [this](const QASubstitution& each) {
        return each.key == DCM_StudyInstanceUID && isUID(each.value.toUtf8()) &&
               each.value.toUtf8() != mOrder.study;
    };
    const auto other = std::find_if(mJob.substitutions.cbegin(), mJob.substitutions.cend(), isOtherStudy);
    if (other != mJob.substitutions.cend() &&
        (mJob.oldStudyUID.isEmpty() || mJob.oldStudyUID == mOrder.study)) {
        mJob.oldStudyUID = mOrder.study;
        mJob.studyUID = other->value.toUtf8();
    }
    return true;
}

/// The study that the job was sent to has been looked at; of a move there is another one.
bool CorrectionBody::mayMove() const
{
    if (mOrder.limits == nullptr || mJob.oldStudyUID.isEmpty())
        return true;
    const QByteArray& other = mJob.studyUID == mOrder.study ? mJob.oldStudyUID : mJob.studyUID;
    return mSight.look(mOrder.limits, other) == Sight::Seen;
}

Http::Response CorrectionBody::correct()
{
    const QByteArray from = mJob.oldStudyUID.isEmpty() ? mJob.studyUID : mJob.oldStudyUID;
    // What was told as stored a moment ago can be corrected.
    const Arrived arrived =
        mStudies.arrivals() != nullptr ? mStudies.arrivals()->bringIn(from) : Arrived::Nothing;
    const int patience = mTurns.rules().patienceMs();
    const Result result =
        mOrder.isPreview ? StudyChange::preview(mJob, patience) : StudyChange::correct(mJob, patience);
    const QAData::Outcome& outcome = mJob.outcome;
    const bool isKept = outcome.fault == ChangeFault::Kept;
    if (isKept)
        expect(result);
    else if (result.bad())
        return failed(result);
    QSet<QByteArray> missing(mJob.images.cbegin(), mJob.images.cend());
    missing.intersect(QSet<QByteArray>(outcome.notFound.cbegin(), outcome.notFound.cend()));
    const bool hasImages = outcome.asked > missing.size();
    if (!hasImages && isLacking(arrived))
        return studyIsBusy();
    // Without it nothing is known of images that are registered: that there are none would be taken for an answer.
    std::shared_ptr<const ServedStudy> study;
    const Presence presence = hasImages ? Presence::Found : mStudies.find(from, study);
    if (presence == Presence::Missing || presence == Presence::Unbuilt)
        return verdictOn(presence).response();
    const int done = isKept ? 202 : 200;
    Http::Response response = Http::textResponse(hasImages ? done : 404, "application/json",
                                                 correctionReport(mJob, mOrder.root, mOrder.isPreview));
    response.addHeader("Cache-Control", "no-store");
    if (!mOrder.isPreview) {
        response.effect = Http::Effect{{mJob.studyUID}, outcome.changed};
        if (!mJob.oldStudyUID.isEmpty())
            response.effect->studies.append(mJob.oldStudyUID);
    }
    return response;
}

/// What is kept and not shown yet is not left to whoever comes next, where this server completes studies.
void CorrectionBody::expect(const Result& reason) const
{
    LogFile::errorf("Request %s: the correction of study %s is not shown yet: %s", mOrder.id.constData(),
                    mJob.studyUID.constData(), qUtf8Printable(reason.text()));
    if (mStudies.arrivals() == nullptr)
        return;
    for (const QByteArray& study : {mJob.studyUID, mJob.oldStudyUID}) {
        if (!study.isEmpty())
            mStudies.arrivals()->takeOver(study);
    }
}

/// What is refused is told in words to whoever asked for it; of what failed here the words are for the log.
Http::Response CorrectionBody::failed(const Result& result) const
{
    if (mJob.outcome.fault == ChangeFault::LockedOut)
        return studyIsBusy();
    if (mJob.outcome.fault == ChangeFault::Refused) {
        QString reason = result.text();
        const QByteArray& image = mJob.outcome.refusedImage;
        if (!isUID(image) && !image.isEmpty())
            reason.replace(QString::fromLatin1(image), QString::fromLatin1(publicKey(image)));
        return Http::failure(409, reason);
    }
    LogFile::errorf("Request %s: study %s is not corrected: %s", mOrder.id.constData(),
                    mJob.studyUID.constData(), qUtf8Printable(result.text()));
    if (mJob.outcome.fault == ChangeFault::Unasked)
        return databaseIsAway();
    return Http::failure(500, QStringLiteral("The correction could not be made; the server's log tells why"));
}

}  // namespace Kdd::DicomWeb
