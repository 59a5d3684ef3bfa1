#pragma once

#include "server/http/Response.h"

#include <QJsonObject>

namespace Kdd::Browser
{

/// A file of the page, 304 when the client has it; 404 when the page has no such file.
Http::Response pageAnswer(const Http::Request& request, const QByteArray& name);

/// JSON that the client asks for anew each time, 304 when it has the same already.
Http::Response jsonAnswer(const Http::Request& request, const QJsonObject& object);

/// A picture of which `etag` tells one state from another, in quotes.
Http::Response pictureAnswer(const Http::Request& request, const QByteArray& jpeg, const QByteArray& etag);

/// Whether the client has what bears the tag.
bool isKnown(const Http::Request& request, const QByteArray& etag);

}  // namespace Kdd::Browser
