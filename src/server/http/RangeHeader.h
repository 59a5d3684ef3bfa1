#pragma once

#include "server/http/Request.h"

#include <QtGlobal>

namespace Kdd::Http
{

/// Which bytes of a body a request wants.
struct WantedBytes
{
    enum class Kind {
        All,         ///< no Range, one of several ranges or in other units, or of another state of the body
        Part,        ///< 206
        Impossible,  ///< 416: beyond the body's end
    };

    Kind kind = Kind::All;
    qint64 offset = 0;
    qint64 length = 0;  ///< of Part and All
};

/// Reads Range and If-Range of a request for a body of `size` bytes whose strong ETag, quotes included, is `etag`.
WantedBytes wantedBytes(const Request& request, qint64 size, const QByteArray& etag);

}  // namespace Kdd::Http
