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
    Http::Response response() const { return Http::failure(status, reason); }
};

}  // namespace Kdd::DicomWeb
