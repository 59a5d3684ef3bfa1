#include "server/dicomweb/change/RemovalResource.h"

#include "server/dicomweb/change/ChangeAnswer.h"

#include <kddlib/LogFile.h>
#include <kddlib/StudyChange.h>

namespace Kdd::DicomWeb
{
namespace
{

Http::Response removed(const QByteArray& study, int images)
{
    Http::Response response =
        Http::textResponse(200, "application/json",
                           "{\"study\":\"" + study + "\",\"images\":" + QByteArray::number(images) + '}');
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
        return removed(path.study, removal.images);
    if (removal.fault == Removal::Fault::Absent)
        return Http::failure(404, asked.text());
    if (removal.fault == Removal::Fault::LockedOut)
        return studyIsBusy();
    if (removal.result.good() || removal.fault == Removal::Fault::Unasked) {
        LogFile::errorf("Request %s: nothing is removed of study %s: %s", request.id.constData(),
                        path.study.constData(), qUtf8Printable(asked.text()));
        return databaseIsAway();
    }
    LogFile::errorf("Request %s: nothing, or not all, is removed of study %s: %s", request.id.constData(),
                    path.study.constData(), qUtf8Printable(asked.text()));
    return Http::failure(500, QStringLiteral("It could not be removed whole; asking again goes on with it"));
}

}  // namespace Kdd::DicomWeb
