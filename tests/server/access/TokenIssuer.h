#pragma once

#include "server/access/AccessRules.h"
#include "support/FileContent.h"

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QProcess>
#include <QTemporaryDir>

#include <stdexcept>

namespace Kdd::Access
{

constexpr qint64 kNow = 1'800'000'000;  // [s since 1970]

/// What tokens give whose scope is to read.
const QByteArray kReaders = R"("rights":[{"claim":"scope","value":"images.read","gives":["read"]}])";

inline QByteArray base64Url(const QByteArray& bytes)
{
    return bytes.toBase64(QByteArray::Base64UrlEncoding | QByteArray::OmitTrailingEquals);
}

/// Issues tokens, with an RSA key and one of P-256. The openssl tool makes the keys and signs.
class TokenIssuer
{
public:
    TokenIssuer()
    {
        openssl("genpkey -algorithm RSA -pkeyopt rsa_keygen_bits:2048 -out rsa.pem");
        openssl("ecparam -name prime256v1 -genkey -noout -out ec.pem");
        openssl("pkey -in rsa.pem -pubout -out public.pem");
    }

    static QJsonObject claims()
    {
        return {{QStringLiteral("iss"), QStringLiteral("https://login.example")},
                {QStringLiteral("aud"), QStringLiteral("archive")},
                {QStringLiteral("sub"), QStringLiteral("anna")},
                {QStringLiteral("scope"), QStringLiteral("openid images.read")},
                {QStringLiteral("exp"), kNow + 300}};
    }
    static QJsonObject claimsWith(const char* name, const QJsonValue& value)
    {
        QJsonObject made = claims();
        made.insert(QLatin1String(name), value);
        return made;
    }
    /// Whatever the clock says.
    static QJsonObject lastingClaims() { return claimsWith("exp", qint64(4'000'000'000)); }

    static QByteArray text(const QJsonObject& object)
    {
        return QJsonDocument(object).toJson(QJsonDocument::Compact);
    }
    static QByteArray header(const char* algorithm = "RS256", const char* id = "rsa")
    {
        return R"({"alg":")" + QByteArray(algorithm) + R"(","typ":"JWT","kid":")" + id + "\"}";
    }

    QByteArray token(const QJsonObject& claims = TokenIssuer::claims()) const
    {
        return signedByRsa(header(), text(claims));
    }
    QByteArray signedByRsa(const QByteArray& head, const QByteArray& body) const
    {
        const QByteArray part = base64Url(head) + '.' + base64Url(body);
        return part + '.' + base64Url(openssl("dgst -sha256 -sign rsa.pem", part));
    }
    QByteArray signedByEc(const QByteArray& head, const QByteArray& body) const
    {
        const QByteArray part = base64Url(head) + '.' + base64Url(body);
        const QByteArray der = openssl("dgst -sha256 -sign ec.pem", part);
        const int size = der[3];
        return part + '.' + base64Url(number(der.mid(4, size)) + number(der.mid(6 + size)));
    }
    /// By the public key as a secret that both sides know.
    QByteArray signedByPublicKey(const QByteArray& head, const QByteArray& body) const
    {
        const QByteArray part = base64Url(head) + '.' + base64Url(body);
        const QByteArray key = openssl("pkey -in rsa.pem -pubout").toHex();
        return part + '.' + base64Url(openssl("dgst -sha256 -binary -mac HMAC -macopt hexkey:" + key, part));
    }

    QJsonObject rsaKey(const char* id = "rsa") const
    {
        const QByteArray modulus = openssl("rsa -in rsa.pem -noout -modulus").trimmed().mid(8);
        return {{QStringLiteral("kty"), QStringLiteral("RSA")},
                {QStringLiteral("kid"), QLatin1String(id)},
                {QStringLiteral("use"), QStringLiteral("sig")},
                {QStringLiteral("n"), QString::fromLatin1(base64Url(QByteArray::fromHex(modulus)))},
                {QStringLiteral("e"), QStringLiteral("AQAB")}};
    }
    QJsonObject ecKey() const
    {
        const QByteArray point = openssl("pkey -in ec.pem -pubout -outform DER").right(64);
        return {{QStringLiteral("kty"), QStringLiteral("EC")},
                {QStringLiteral("kid"), QStringLiteral("ec")},
                {QStringLiteral("crv"), QStringLiteral("P-256")},
                {QStringLiteral("x"), QString::fromLatin1(base64Url(point.left(32)))},
                {QStringLiteral("y"), QString::fromLatin1(base64Url(point.right(32)))}};
    }
    static QByteArray keySet(const QJsonArray& keys) { return text({{QStringLiteral("keys"), keys}}); }
    QByteArray keySet() const { return keySet({rsaKey(), ecKey()}); }

    /// Those of a server that takes its tokens, by keys that lie in the folder then; `more` says what the tokens give.
    AccessRules rules(const QString& folder, const QByteArray& more) const
    {
        const QString file = folder + QStringLiteral("/keys.json");
        putFile(file, keySet());
        AccessRules made;
        const QByteArray text =
            R"({"tokens":{"issuer":"https://login.example","audience":"archive","keys":")" + file.toUtf8() +
            "\"," + more + "}}";
        EXPECT_EQ(AccessRules::parse(text, made).text(), QString());
        return made;
    }

    /// Runs the tool in the folder of the keys.
    QByteArray openssl(const QByteArray& arguments, const QByteArray& input = {}) const
    {
        QProcess process;
        process.setWorkingDirectory(mFolder.path());
        process.start(QStringLiteral("openssl"), QString::fromLatin1(arguments).split(QLatin1Char(' ')));
        process.write(input);
        process.closeWriteChannel();
        if (!process.waitForFinished() || process.exitCode() != 0)
            throw std::runtime_error("openssl " + arguments.toStdString());
        return process.readAllStandardOutput();
    }

private:
    /// Of a signature's two, which DER writes without zeros in front, but with one before a high bit.
    static QByteArray number(const QByteArray& der) { return der.right(32).rightJustified(32, '\0'); }

    QTemporaryDir mFolder;
};

}  // namespace Kdd::Access
