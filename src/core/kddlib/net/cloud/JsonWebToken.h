#pragma once

#include <QByteArray>

class QJsonObject;

namespace Kdd
{

/// The token of a header and a claim set, signed by RSA with SHA-256 ("RS256"): three base64url texts with dots
/// between. Empty, with an error in the log, when the key (PEM) is no RSA private key that can be read without a
/// passphrase, has more than 16,384 bits, or cannot sign.
QByteArray signedJsonWebToken(const QJsonObject& header, const QJsonObject& claims,
                              const QByteArray& privateKey);

}  // namespace Kdd
