#include "server/dicomweb/store/StoreResource.h"

#include "server/http/AcceptHeader.h"
#include "server/http/ContentType.h"

namespace Kdd::DicomWeb
{
namespace
{

/// Requests that bring objects at a time, each with a file that is open. More come from no site whose modalities and
/// gateways have connections of their own.
constexpr int kMostAtOnce = 256;

constexpr int kLongestBoundary = 200;  // [bytes]

const QVector<Http::MediaType> kOffers = {
    {"application/dicom+json", ""}, {"application/json", ""}, {"application/dicom+xml", ""}};

Http::Response busy(const QString& reason, const char* after)
{
    Http::Response response = Http::failure(503, reason);
    response.addHeader("Retry-After", after);
    return response;
}

/// 0, or the status that refuses the body.
int readType(const Http::Request& request, QByteArray& boundary, QString& reason)
{
    const Http::ContentType type = Http::ContentType::parse(request.header("content-type"));
    const QByteArray parts = type.parameter("type").toLower();
    if (type.name == "application/dicom")
        return 0;
    if (type.name != "multipart/related" || (!parts.isEmpty() && parts != "application/dicom")) {
        reason =
            QStringLiteral("Objects are taken as multipart/related of application/dicom, and one alone as "
                           "application/dicom");
        return 415;
    }
    boundary = type.parameter("boundary");
    if (!boundary.isEmpty() && boundary.size() <= kLongestBoundary)
        return 0;
    reason =
        QStringLiteral("multipart/related needs a boundary, of at most %1 letters").arg(kLongestBoundary);
    return 400;
}

}  // namespace

/// Nothing is asked here: what was stored is found where everything else is.
Http::Response StoreResource::answer(const Http::Request& /*request*/, const ResourcePath& /*path*/)
{
    return Http::failure(404, QStringLiteral("No resource has this path"));
}

bool StoreResource::receives(const ResourcePath& path) const
{
    return path.series.isEmpty() && path.instance.isEmpty() && path.rest.isEmpty() &&
           path.resource == (path.study.isEmpty() ? "studies" : "");
}

Http::Response StoreResource::receive(const Http::Request& request, const ResourcePath& path)
{
    StoreOrder order;
    QString reason;
    const int refusal = readType(request, order.boundary, reason);
    if (refusal != 0)
        return Http::failure(refusal, reason);
    const int offer = Http::AcceptHeader::of(request).choose(kOffers);
    if (offer < 0)
        return Http::failure(406, QStringLiteral("What was stored is told as application/dicom+json or "
                                                 "application/dicom+xml"));
    if (!mArrivals.store().hasRoom())
        return busy(QStringLiteral("The disk is nearly full"), "60");
    if (++mCount > kMostAtOnce) {
        --mCount;
        return busy(QStringLiteral("Too many requests bring objects"), "1");
    }
    order.id = request.id;
    order.root = request.base;
    order.studyUID = path.study;
    order.limits = request.studies;
    order.form = offer == 2 ? StoreReport::Form::Xml : StoreReport::Form::Json;
    Http::Response response;
    response.sink =
        std::make_unique<StoreBody>(mArrivals, mSight, mLimits, std::move(order), [this] { --mCount; });
    return response;
}

}  // namespace Kdd::DicomWeb
