#include "server/access/SignedToken.h"

#include "server/access/Base64Url.h"
#include "server/http/StrictJson.h"

#include <QList>

namespace Kdd::Access
{
namespace
{

/// Providers that put groups into their tokens come to some 8 KiB. The header of a request, which it is part of, is
/// bounded too.
constexpr int kLongest = 16 * 1024;  // [bytes]
constexpr int kLongestKeyId = 256;

bool isAbsentOrText(const QJsonObject& object, const char* name)
{
    const QJsonValue value = object.value(QLatin1String(name));
    return value.isUndefined() || value.isString();
}

/// A token that says what it is must be one for access: there are others of the same form and signer, for logging out.
bool isForAccess(const QJsonObject& header)
{
    const QString type = header.value(QLatin1String("typ")).toString().toLower();
    return type.isEmpty() || type == QLatin1String("jwt") || type == QLatin1String("at+jwt") ||
           type == QLatin1String("application/at+jwt");
}

bool readHeader(const QJsonObject& header, SignedToken& read)
{
    const QString algorithm = header.value(QLatin1String("alg")).toString();
    if (algorithm == QLatin1String("RS256"))
        read.algorithm = Algorithm::RS256;
    else if (algorithm == QLatin1String("ES256"))
        read.algorithm = Algorithm::ES256;
    else
        return false;
    read.keyId = header.value(QLatin1String("kid")).toString().toUtf8();
    return !header.contains(QLatin1String("crit")) && isAbsentOrText(header, "kid") &&
           isAbsentOrText(header, "typ") && isForAccess(header) && read.keyId.size() <= kLongestKeyId;
}

}  // namespace

bool SignedToken::parse(const QByteArray& token, SignedToken& read)
{
    if (token.size() > kLongest || token.count('.') != 2)
        return false;
    const QList<QByteArray> parts = token.split('.');
    QByteArray header;
    QByteArray claims;
    QJsonObject headerObject;
    SignedToken made;
    if (!decodeBase64Url(parts[0], header) || !Http::parseObject(header, headerObject) ||
        !readHeader(headerObject, made) || !decodeBase64Url(parts[1], claims) ||
        !Http::parseObject(claims, made.claims) || !decodeBase64Url(parts[2], made.signature) ||
        made.signature.isEmpty())
        return false;
    made.text = parts[0] + '.' + parts[1];
    read = made;
    return true;
}

}  // namespace Kdd::Access
