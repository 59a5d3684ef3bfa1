#pragma once

#include "server/dicomweb/retrieve/BulkValue.h"

namespace Kdd::DicomWeb
{

/// The value alone, or what the request's Range wants of it; 304 for whoever has it.
Http::Response alone(const Http::Request& request, const BulkValue& value, const QByteArray& contentType);

}  // namespace Kdd::DicomWeb
