#include "server/dicomweb/change/CorrectionsResource.h"

#include "server/dicomweb/change/ChangeAnswer.h"
#include "server/dicomweb/change/CorrectionBody.h"
#include "server/dicomweb/change/CorrectionHistory.h"
#include "server/http/AcceptHeader.h"
#include "server/http/ContentType.h"
#include "server/http/EntityTag.h"

namespace Kdd::DicomWeb
{
namespace
{

const QVector<Http::MediaType> kHistoryForms = {{"application/json", ""}, {"text/csv", ""}};
const QVector<Http::MediaType> kReportForms = {{"application/json", ""}};

bool readFlag(const Http::Request& request, const char* name, bool& flag)
{
    const QVector<QByteArray> values = request.parameters(name);
    flag = values.value(0) == "true";
    return values.isEmpty() || (values.size() == 1 && (flag || values[0] == "false"));
}

bool readUids(const Http::Request& request, const char* name, QList<QByteArray>& uids)
{
    for (const QByteArray& value : request.parameters(name)) {
        for (const QByteArray& uid : value.split(',')) {
            if (!isUID(uid))
                return false;
            uids.append(uid);
        }
    }
    return true;
}

/// Status 0 when it can be followed.
Http::Response readOrder(const Http::Request& request, CorrectionOrder& order)
{
    const QByteArray type = Http::ContentType::parse(request.header("content-type")).name;
    // None of the forms that a page can send without asking before.
    if (type != "application/json" && type != "application/xml" && type != "text/xml")
        return Http::failure(415, QStringLiteral("A job is taken as application/json or application/xml"));
    order.form = type == "application/json" ? JobForm::Json : JobForm::Xml;
    if (Http::AcceptHeader::of(request).choose(kReportForms) < 0)
        return Http::failure(406, QStringLiteral("What was done is told as application/json"));
    Http::Response unknown = unknownParameter(request, {"accept", "all", "image", "preview", "series"});
    if (unknown.status != 0)
        return unknown;
    if (!readFlag(request, "preview", order.isPreview) || !readFlag(request, "all", order.isOfWholeStudy))
        return Http::failure(400, QStringLiteral("preview and all are true or false"));
    if (!readUids(request, "image", order.images) || !readUids(request, "series", order.series))
        return Http::failure(400, QStringLiteral("image and series are lists of UIDs"));
    order.root = request.base;
    order.caller = request.caller;
    order.id = request.id;
    order.limits = request.studies;
    return Http::Response(0);
}

}  // namespace

bool CorrectionsResource::owns(const ResourcePath& path) const
{
    return path.resource == "corrections" && !path.study.isEmpty() && path.series.isEmpty() &&
           path.rest.isEmpty();
}

Http::Response CorrectionsResource::answer(const Http::Request& request, const ResourcePath& path)
{
    const int form = Http::AcceptHeader::of(request).choose(kHistoryForms);
    if (form < 0)
        return Http::failure(406, QStringLiteral("Corrections are told as application/json or text/csv"));
    if (mStudies.arrivals() != nullptr)
        mStudies.arrivals()->bringIn(path.study);
    std::shared_ptr<const ServedStudy> study;
    const Presence presence = mStudies.find(path.study, study);
    if (presence != Presence::Found)
        return verdictOn(presence).response();
    const bool isCsv = form == 1;
    const QByteArray tag = '"' + study->version() + (isCsv ? "-csv\"" : "-json\"");
    if (Http::hasEntity(request, tag))
        return Http::notModified(tag);
    Http::Response response;
    Http::addEntityTag(tag, response);
    response.addHeader("Content-Type",
                       isCsv ? "text/csv; charset=utf-8; header=present" : "application/json");
    if (isCsv)
        response.addHeader("Content-Disposition",
                           "attachment; filename=\"corrections-" + path.study + ".csv\"");
    response.body.emplace_back(std::make_unique<CorrectionHistory>(
        std::move(study), path.study, isCsv ? CorrectionHistory::Form::Csv : CorrectionHistory::Form::Json));
    return response;
}

bool CorrectionsResource::receives(const ResourcePath& path) const
{
    return mTurns.rules().corrections && owns(path);
}

Http::Response CorrectionsResource::receive(const Http::Request& request, const ResourcePath& path)
{
    CorrectionOrder order;
    order.study = path.study;
    Http::Response response = readOrder(request, order);
    if (response.status != 0)
        return response;
    response.status = 200;
    response.sink = std::make_unique<CorrectionBody>(mStudies, mSight, mTurns, std::move(order));
    return response;
}

}  // namespace Kdd::DicomWeb
