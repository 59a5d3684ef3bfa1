#pragma once

#include "server/dicomweb/retrieve/BulkValue.h"
#include "server/http/Request.h"
#include "server/http/Response.h"

namespace Kdd::DicomWeb
{

/// The value alone, or what the request's Range wants of it; 304 to a client that has it.
Http::Response answerAlone(const Http::Request& request, const BulkValue& value,
                           const QByteArray& contentType);

}  // namespace Kdd::DicomWeb
