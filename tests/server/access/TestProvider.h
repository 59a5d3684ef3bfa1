#pragma once

#include "server/access/TokenIssuer.h"
#include "support/HttpServer.h"

#include <QCryptographicHash>
#include <QUrl>
#include <QUrlQuery>

namespace Kdd::Access
{

/// An OpenID Connect provider that asks nobody for a password: tells of itself, sends browsers back with a code, and gives a
/// token for that, once, to who knows what the code was asked for with.
class TestProvider
{
public:
    TestProvider()
        : mServer([this](const QByteArray& request) { return answer(request); })
    {
    }

    QByteArray url(const char* path = "") const
    {
        return QByteArray::fromStdString(mServer.url("")).chopped(1) + path;
    }

    /// Where the browser goes from there.
    QByteArray authorise(const QByteArray& address)
    {
        const QUrlQuery query{QUrl(QString::fromLatin1(address))};
        asked.clear();
        for (const auto& item : query.queryItems(QUrl::FullyDecoded))
            asked.insert(item.first, item.second);
        const std::lock_guard<std::mutex> lock(mMutex);
        mChallenges.insert(QByteArray("code") + QByteArray::number(++mCodes), asked);
        return asked.value(QStringLiteral("redirect_uri")).toUtf8() + "?code=code" +
               QByteArray::number(mCodes) + "&state=" + asked.value(QStringLiteral("state")).toUtf8();
    }

    const TokenIssuer issuer;
    QMap<QString, QString> asked;  ///< with the last code
    std::function<QByteArray(QJsonObject)>
        sign;                  ///< what becomes of the claims; as they are when it is empty
    QByteArray authorisation;  ///< that the last request for a token brought

private:
    ScriptedServer::Reply answer(const QByteArray& request)
    {
        const std::lock_guard<std::mutex> lock(mMutex);
        if (request.startsWith("GET /.well-known/openid-configuration "))
            return {httpResponse(TokenIssuer::text(
                {{QStringLiteral("issuer"), QString::fromLatin1(url())},
                 {QStringLiteral("authorization_endpoint"), QString::fromLatin1(url("/authorise?a=b"))},
                 {QStringLiteral("token_endpoint"), QString::fromLatin1(url("/token"))},
                 {QStringLiteral("end_session_endpoint"), QString::fromLatin1(url("/end"))}}))};
        if (request.startsWith("GET /keys "))
            return {httpResponse(mKeys)};
        const QUrlQuery form(QString::fromLatin1(request.mid(request.indexOf("\r\n\r\n") + 4)));
        const auto field = [&](const char* name) {
            return form.queryItemValue(QLatin1String(name), QUrl::FullyDecoded);
        };
        const QMap<QString, QString> code = mChallenges.take(field("code").toLatin1());
        const QByteArray digest =
            QCryptographicHash::hash(field("code_verifier").toLatin1(), QCryptographicHash::Sha256);
        authorisation = headerOf(request, "Authorization");
        const bool isGood = request.startsWith("POST /token ") &&
                            field("grant_type") == QLatin1String("authorization_code") &&
                            code.value(QStringLiteral("code_challenge_method")) == QLatin1String("S256") &&
                            code.value(QStringLiteral("code_challenge")).toLatin1() == base64Url(digest) &&
                            code.value(QStringLiteral("redirect_uri")) == field("redirect_uri");
        if (!isGood)
            return {httpResponse(R"({"error":"invalid_grant"})", "400 Bad Request")};
        QJsonObject claims = TokenIssuer::lastingClaims();
        claims.insert(QStringLiteral("iss"), QString::fromLatin1(url()));
        claims.insert(QStringLiteral("aud"), QStringLiteral("kdd"));
        claims.insert(QStringLiteral("nonce"), code.value(QStringLiteral("nonce")));
        const QByteArray token = sign ? sign(claims) : issuer.token(claims);
        return {httpResponse(TokenIssuer::text({{QStringLiteral("id_token"), QString::fromLatin1(token)},
                                                {QStringLiteral("token_type"), QStringLiteral("Bearer")}}))};
    }

    const QByteArray mKeys = issuer.keySet();  // made once: a server does not wait long for them
    std::mutex mMutex;
    QMap<QByteArray, QMap<QString, QString>> mChallenges;
    int mCodes = 0;
    ScriptedServer mServer;
};

}  // namespace Kdd::Access
