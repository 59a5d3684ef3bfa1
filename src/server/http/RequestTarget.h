#pragma once

#include "server/http/Request.h"

namespace Kdd::Http
{

/// The address in a request's first line, taken apart and decoded.
///
///     /dicom-web/studies?limit=5   path "dicom-web", "studies", query limit=5
///     http://host:80/a%20b         authority "host:80", path "a b": as clients write it to a proxy
///     *                            nothing: the server as a whole
struct RequestTarget
{
    QByteArray authority;      ///< null unless the target names it
    QVector<QByteArray> path;  ///< segments as in `Request`; empty ones, as "//" makes them, are passed over
    QVector<Field> query;      ///< "+" is a blank, but for parameters whose value is a media type

    /// False when it is no address, an escape is none, something decodes to a NUL, a segment decodes to ".", ".." or
    /// something with "/", or there are more segments or parameters than anyone needs. Then `parsed` is empty.
    static bool parse(const QByteArray& target, RequestTarget& parsed);
};

}  // namespace Kdd::Http
