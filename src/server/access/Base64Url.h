#pragma once

#include <QByteArray>

namespace Kdd::Access
{

/// The bytes of a base64url text, which has no padding, no blanks and no letter too many. False for any other text, so
/// that no two texts stand for the same bytes.
bool decodeBase64Url(const QByteArray& text, QByteArray& bytes);

}  // namespace Kdd::Access
