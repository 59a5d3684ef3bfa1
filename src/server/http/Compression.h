#pragma once

#include "server/http/Response.h"

namespace Kdd::Http
{

/// Whether a body of that size [bytes] goes compressed to whoever sent the request: he takes it so, and it pays.
bool isWorthCompressing(const Request& request, qint64 size);

/// Compresses a body that is there as a whole, where that is so, and tells those who keep answers that it depends on the
/// request. An answer with an entity tag does so by itself, since its other form needs another tag.
void compress(const Request& request, Response& response);

}  // namespace Kdd::Http
