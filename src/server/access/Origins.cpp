#include "server/access/Origins.h"

namespace Kdd::Access
{
namespace
{

constexpr const char* kMethods = "GET, HEAD, POST, DELETE, OPTIONS";
constexpr const char* kRequestHeaders = "Accept, Authorization, Content-Type, If-None-Match, Range";
constexpr const char* kAnswerHeaders =
    "Content-Location, Content-Range, Content-Type, ETag, Location, Retry-After, Warning, X-Request-Id";

/// Scheme, host and port of an address, as browsers write it: small, and without the port that is meant anyway.
QByteArray originOf(const QByteArray& address)
{
    const QByteArray text = address.toLower();
    const int end = text.indexOf('/', text.indexOf("://") + 3);
    QByteArray origin = text.left(end < 0 ? text.size() : end);
    if (origin.startsWith("https://") && origin.endsWith(":443"))
        origin.chop(4);
    if (origin.startsWith("http://") && origin.endsWith(":80"))
        origin.chop(3);
    return origin;
}

}  // namespace

Origins::Origins(const OriginRules& rules)
    : mMaxAge(QByteArray::number(static_cast<qlonglong>(rules.maxAge.count())))
{
    for (const QByteArray& origin : rules.origins)
        mOrigins.append(originOf(origin));
}

bool Origins::isPreflight(const Http::Request& request) const
{
    return !mOrigins.isEmpty() && request.method == Http::Method::Options &&
           !request.header("origin").isNull() && !request.header("access-control-request-method").isNull();
}

Http::Response Origins::preflight(const Http::Request& request) const
{
    if (!isKnown(request.header("origin")))
        return Http::failure(403, QStringLiteral("Pages of this origin are not let in"));
    Http::Response response(204);
    response.addHeader("Access-Control-Allow-Methods", kMethods);
    response.addHeader("Access-Control-Allow-Headers", kRequestHeaders);
    response.addHeader("Access-Control-Max-Age", mMaxAge);
    return response;
}

void Origins::mark(const Http::Request& request, Http::Response& response) const
{
    if (mOrigins.isEmpty())
        return;
    // Also where there is none: a cache must not give one page the answer to another.
    response.addHeader("Vary", "Origin");
    const QByteArray origin = request.header("origin");
    if (!isKnown(origin))
        return;
    response.addHeader("Access-Control-Allow-Origin", origin);
    response.addHeader("Access-Control-Expose-Headers", kAnswerHeaders);
}

bool Origins::isForeign(const Http::Request& request) const
{
    const QByteArray origin = request.header("origin");
    if (!origin.isNull())
        return !isKnown(origin) && origin != originOf(request.base);
    // Some requests of pages come without their origin; then the browser may say how far that is from here.
    const QByteArray site = request.header("sec-fetch-site");
    return !site.isNull() && site != "same-origin" && site != "none";
}

}  // namespace Kdd::Access
