#pragma once

#include "server/http/Response.h"

namespace Kdd::Http
{

/// Whether the client says by If-None-Match that it has what the strong tag, quotes included, stands for. An empty tag
/// stands for nothing that could be told apart.
bool hasEntity(const Request& request, const QByteArray& tag);

/// 304, to be asked for again each time.
Response notModified(const QByteArray& tag);

/// Marks an answer so that it may be kept, and is asked for again each time: corrections count at once. Without a tag
/// it is only not to be shared.
void addEntityTag(const QByteArray& tag, Response& response);

}  // namespace Kdd::Http
