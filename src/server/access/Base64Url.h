#pragma once

#include <QByteArray>
#include <QJsonObject>

namespace Kdd::Access
{

/// A JSON object and nothing else. False when it is none, or says something twice: two readers of such a text may take
/// two different things from it.
bool parseObject(const QByteArray& text, QJsonObject& object);

/// The bytes of a base64url text, which has no padding, no blanks and no letter too many. False for any other text, so
/// that no two texts stand for the same bytes.
bool decodeBase64Url(const QByteArray& text, QByteArray& bytes);

}  // namespace Kdd::Access
