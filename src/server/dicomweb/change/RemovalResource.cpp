#include "server/dicomweb/change/RemovalResource.h"

#include "server/dicomweb/change/ChangeAnswer.h"

#include <kddlib/LogFile.h>
#include <kddlib/StudyChange.h>

namespace Kdd::DicomWeb
{
namespace
{

Http::Response removed(const QByteArray& study, int images, bool isPending)
{
    const QByteArray report = "{\"study\":\"" + study + "\",\"images\":" + QByteArray::number(images) +
                              ",\"pending\":" + (isPending ? "true" : "false") + '}';
    Http::Response response = Http::textResponse(isPending ? 202 : 200, "application/json", report);
    response.addHeader("Cache-Control", "no-store");
    response.effect = Http::Effect{{study}, images};
    return response;
}

}  // namespace

/// Nothing is asked here.
Http::Response RemovalResource::answer(const Http::Request& /*request*/, const ResourcePath& /*path*/)
{
    return Http::failure(404, QStringLiteral("No resource has this path"));
}

bool RemovalResource::removes(const ResourcePath& path) const
{
    return mTurns.rules().deletions && !path.study.isEmpty() && path.resource.isEmpty() &&
           path.rest.isEmpty();
}

Http::Response RemovalResource::remove(const Http::Request& request, const ResourcePath& path)
{
    Http::Response unknown = unknownParameter(request, {});
    if (unknown.status != 0)
        return unknown;
    const Turn turn(mTurns);
    if (!turn)
        return tooManyChanges();
    Removal removal;
    const Result asked = mDatabase.ask([&](Kxg::Catalogue& catalogue) {
        removal = StudyChange(catalogue).remove({path.study, path.series, path.instance},
                                                mTurns.rules().patienceMs());
        return removal.result;
    });
    if (asked.good())
        return removed(path.study, removal.images, false);
    if (removal.fault == ChangeFault::Absent)
        return Http::failure(404, asked.text());
    if (removal.fault == ChangeFault::LockedOut)
        return studyIsBusy();
    if (removal.result.good() || removal.fault == ChangeFault::Unasked) {
        LogFile::errorf("Request %s: nothing is removed of study %s: %s", request.id.constData(),
                        path.study.constData(), qUtf8Printable(asked.text()));
        return databaseIsAway();
    }
    const bool isKept = removal.fault == ChangeFault::Kept;
    LogFile::errorf("Request %s: %s removed of study %s: %s", request.id.constData(),
                    isKept ? "not all is yet" : "nothing is", path.study.constData(),
                    qUtf8Printable(asked.text()));
    if (!isKept)
        return Http::failure(500, QStringLiteral("It could not be removed; the server's log tells why"));
    if (mStudies.arrivals() != nullptr)
        mStudies.arrivals()->takeOver(path.study);
    return removed(path.study, removal.images, true);
}

}  // namespace Kdd::DicomWeb
