#pragma once

#include "server/http/Response.h"

namespace Kdd::DicomWeb
{

/// Whether a request can be answered, and if not, with which status and words.
struct Verdict
{
    int status = 0;  ///< 0: it can
    QString reason;

    bool good() const { return status == 0; }
    bool bad() const { return status != 0; }

    Http::Response response() const
    {
        Http::Response made = Http::failure(status, reason);
        if (status == 503)
            made.addHeader("Retry-After", "2");
        return made;
    }
};

}  // namespace Kdd::DicomWeb
