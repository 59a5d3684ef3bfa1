#pragma once

#include "server/http/Response.h"

namespace Kdd::Http
{

/// Whether the client says by If-None-Match that it has what the strong tag, quotes included, stands for. An empty tag
/// stands for nothing that could be told apart. "*" says no more than that there is something.
enum class AnyTag { Counts, DoesNotCount };
bool hasEntity(const Request& request, const QByteArray& tag, AnyTag any = AnyTag::Counts);

/// 304, to be asked for again each time.
Response notModified(const QByteArray& tag, const QByteArray& vary = "Accept");

/// Marks an answer so that it may be kept, and is asked for again each time: corrections count at once. Without a tag
/// it is only not to be shared. `vary` names the headers of a request that it depends on.
void addEntityTag(const QByteArray& tag, Response& response, const QByteArray& vary = "Accept");

}  // namespace Kdd::Http
