#pragma once

#include "server/access/AccessRules.h"
#include "server/http/Response.h"

namespace Kdd::Access
{

/// What pages of other origins may do by the browser of whoever looks at them (CORS).
class Origins
{
public:
    explicit Origins(const OriginRules& rules);

    /// Whether a browser asks if a page may ask. Nobody is let in for that: browsers send no token along.
    bool isPreflight(const Http::Request& request) const;

    /// 204, or 403 for a page of another origin than those that are let in.
    Http::Response preflight(const Http::Request& request) const;

    /// Tells the browser whether its page may have the answer.
    void mark(const Http::Request& request, Http::Response& response) const;

    /// Whether the request comes from a page that is neither ours nor of an origin that is let in. A browser sends some
    /// requests without asking before, with all that it knows of its user.
    bool isForeign(const Http::Request& request) const;

    /// Whether it certainly comes from a page of ours, or from no page: browsers say of whom, and let a page of another origin
    /// send no header of its own choice without asking.
    static bool isOwn(const Http::Request& request);

private:
    bool isKnown(const QByteArray& origin) const { return mOrigins.contains(origin); }

    QVector<QByteArray> mOrigins;
    QByteArray mMaxAge;
};

}  // namespace Kdd::Access
