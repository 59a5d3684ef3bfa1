#pragma once

#include <QByteArray>

class QJsonObject;

namespace Kdd
{

class Result;

/// The token of a header and a claim set, signed by RSA with SHA-256 ("RS256"): three base64url texts with dots
/// between. Fails, with `token` as it was, when the key (PEM) is no RSA private key that can be read without a
/// passphrase, has more than 16,384 bits, or cannot sign.
Result signJsonWebToken(const QJsonObject& header, const QJsonObject& claims, const QByteArray& privateKey,
                        QByteArray& token);

}  // namespace Kdd
