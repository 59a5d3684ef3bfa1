#pragma once

#include "platform/base/Export.h"

#include <QtGlobal>

#include <map>
#include <string>

namespace Kdd
{

/// What became of an HTTP request: what the server answered, and whether the answer came through. A value. Each
/// thread uses a copy of its own.
struct KDD_EXPORT KxHttpStatus
{
    /// The response code; 0 as long as no header has arrived.
    qint32 code = 0;

    /// The response's headers by their names in lower case, values as sent; of two with one name the later counts.
    /// The status line stands among them, as a name with an empty value.
    std::map<std::string, std::string> headers;

    /// The transfer broke off, whatever the code says: no connection, a stall, fewer bytes than announced.
    bool failed = false;

    /// Bytes of the body that have arrived.
    quint64 bytesReceived = 0;

    /// From the making of the request to the first line of the response [ms].
    qint32 msToFirstHeader = 0;

    /// Why it counts as failed; empty while it does not.
    std::string failure = {};

    /// A code from 200 to 299, and not failed.
    bool ok() const { return code >= 200 && code <= 299 && !failed; }

    /// Why it is not ok, in words for a message: `failure`, or which code the server answered with. Empty when it is ok.
    std::string reason() const;

    /// The status of no request at all. Any thread may ask for it.
    static const KxHttpStatus& empty();
};

}  // namespace Kdd
