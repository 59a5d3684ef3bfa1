#include "kddlib/net/cloud/KxGoogleAuth.h"

#include "kddlib/net/cloud/JsonWebToken.h"
#include "kddlib/net/cloud/ServiceAccountKey.h"
#include "kddlib/net/http/KxHttpStatus.h"
#include "platform/base/LogFile.h"
#include "platform/base/Result.h"

#include <QJsonDocument>
#include <QJsonObject>
#include <QUrl>

#include <algorithm>
#include <chrono>
#include <mutex>

namespace Kdd
{
namespace
{

// The clock counts steps of 100 ns.
constexpr qint64 kTicksPerSecond = 10'000'000;
// A token that is handed out has to last for the request that takes it along.
constexpr qint64 kMargin = 500 * kTicksPerSecond;
constexpr qint64 kTokenRequestLifetime = 3600;  // [s]
constexpr double kLongestLifetime =
    1e9;  // [s], some thirty years, so that no answer makes the expiry overflow
constexpr char kAllCloudResources[] = "https://www.googleapis.com/auth/cloud-platform";
constexpr char kGrantType[] = "urn:ietf:params:oauth:grant-type:jwt-bearer";
constexpr int kLongestLoggedAnswer = 1000;  // [bytes]

qint64 systemTicks()
{
    using Ticks = std::chrono::duration<qint64, std::ratio<1, kTicksPerSecond>>;
    const auto now = std::chrono::system_clock::now().time_since_epoch();
    return std::chrono::duration_cast<Ticks>(now).count();
}

QString joined(const std::vector<std::string>& scopes)
{
    std::string text;
    for (const std::string& scope : scopes)
        text += (text.empty() ? "" : " ") + scope;
    return QString::fromStdString(text);
}

/// The answer for the log, which must not hold a token that is still good.
QByteArray withoutToken(const QJsonDocument& answer)
{
    const QLatin1String token("access_token");
    QJsonObject object = answer.object();
    if (!object.value(token).toString().isEmpty())
        object.insert(token, QStringLiteral("..."));
    const QJsonDocument shown = answer.isObject() ? QJsonDocument(object) : answer;
    return shown.toJson(QJsonDocument::Compact).left(kLongestLoggedAnswer);
}

/// A line end inside a value would let the server add headers to all that is sent to the storage.
bool isHeaderText(const QString& text)
{
    const auto isPrintable = [](QChar c) { return c.unicode() >= ' ' && c.unicode() <= '~'; };
    return !text.isEmpty() && std::all_of(text.begin(), text.end(), isPrintable);
}

}  // namespace

struct KDD_LOCAL KxGoogleAuth::Private
{
    bool startWith(const ServiceAccountKey& newKey, const Result& reading);
    bool loadFile();
    bool isFresh(qint64 now) const { return !header.isEmpty() && expiry - kMargin >= now; }
    Result makeForm(qint64 now, QByteArray& form) const;
    QByteArray fetch(const Exchange& exchange, qint64 now);
    QByteArray takeAnswer(const QJsonDocument& answer, qint64 now);

    std::mutex mutex;
    Clock clock;
    ServiceAccountKey key;
    std::vector<std::string> scopes;
    std::string subject;
    QByteArray bodyPrefix;
    QByteArray header;
    qint64 expiry = 0;  // [100 ns since 1970]
};

/// False, with the error logged and the former key still in force, when reading the new one failed.
bool KxGoogleAuth::Private::startWith(const ServiceAccountKey& newKey, const Result& reading)
{
    if (reading.bad()) {
        LogFile::errorf("%s", qUtf8Printable(reading.text()));
        return false;
    }
    key = newKey;
    bodyPrefix = "grant_type=" + QUrl::toPercentEncoding(QLatin1String(kGrantType));
    // Its token is another account's.
    header.clear();
    return true;
}

bool KxGoogleAuth::Private::loadFile()
{
    ServiceAccountKey newKey;
    const Result reading = readServiceAccountFile(newKey);
    return startWith(newKey, reading);
}

/// The form that asks for a token.
Result KxGoogleAuth::Private::makeForm(qint64 now, QByteArray& form) const
{
    const qint64 seconds = now / kTicksPerSecond;
    const QJsonObject jwtHeader = {{QStringLiteral("alg"), QStringLiteral("RS256")},
                                   {QStringLiteral("kid"), QString::fromStdString(key.id)},
                                   {QStringLiteral("typ"), QStringLiteral("JWT")}};
    QJsonObject claims = {
        {QStringLiteral("iss"), QString::fromStdString(key.clientEmail)},
        {QStringLiteral("scope"), scopes.empty() ? QString::fromLatin1(kAllCloudResources) : joined(scopes)},
        {QStringLiteral("aud"), QString::fromStdString(key.tokenUri)},
        {QStringLiteral("iat"), seconds},
        {QStringLiteral("exp"), seconds + kTokenRequestLifetime}};
    if (!subject.empty())
        claims.insert(QStringLiteral("sub"), QString::fromStdString(subject));
    QByteArray token;
    Result signing = signJsonWebToken(jwtHeader, claims, QByteArray::fromStdString(key.privateKey), token);
    form = bodyPrefix + "&assertion=" + token;
    return signing;
}

/// Signs who the account is and exchanges that for a token. Empty, with the
/// reason logged, when there is none to be had.
QByteArray KxGoogleAuth::Private::fetch(const Exchange& exchange, qint64 now)
{
    QByteArray form;
    if (const Result signing = makeForm(now, form); signing.bad()) {
        LogFile::errorf("%s", qUtf8Printable(signing.text()));
        return {};
    }
    KxHttpStatus status;
    const QJsonDocument answer = exchange(key.tokenUri, form, status);
    if (status.ok())
        return takeAnswer(answer, now);
    const QByteArray reason =
        status.failed ? QByteArray::fromStdString(status.failure) : withoutToken(answer);
    LogFile::errorf("Could not get authorization header from %s, response code %d. %s", key.tokenUri.c_str(),
                    status.code, reason.constData());
    return {};
}

QByteArray KxGoogleAuth::Private::takeAnswer(const QJsonDocument& answer, qint64 now)
{
    const QString token = answer.object().value(QLatin1String("access_token")).toString();
    const QString type = answer.object().value(QLatin1String("token_type")).toString();
    // Without a lifetime the token counts as expired: it serves this request, and the next one asks anew.
    const double lifetime = answer.object().value(QLatin1String("expires_in")).toDouble();
    // The former token stays: until its own margin it is as good as before.
    if (!isHeaderText(token) || !isHeaderText(type)) {
        LogFile::errorf("Invalid authorization response. %s", withoutToken(answer).constData());
        return {};
    }
    header = "Authorization: " + type.toLatin1() + ' ' + token.toLatin1();
    expiry = now + static_cast<qint64>(qBound(0.0, lifetime, kLongestLifetime)) * kTicksPerSecond;
    return header;
}

KxGoogleAuth::KxGoogleAuth()
    : KxGoogleAuth(&systemTicks)
{
}

KxGoogleAuth::KxGoogleAuth(Clock clock)
    : mPrivate(std::make_unique<Private>())
{
    mPrivate->clock = std::move(clock);
}

KxGoogleAuth::~KxGoogleAuth() = default;

bool KxGoogleAuth::loadCredentials()
{
    const std::lock_guard lock(mPrivate->mutex);
    return mPrivate->loadFile();
}

bool KxGoogleAuth::loadCredentialsFromJson(const QJsonObject& object, const char* source)
{
    const std::lock_guard lock(mPrivate->mutex);
    ServiceAccountKey newKey;
    const Result reading = readServiceAccountKey(object, source, newKey);
    return mPrivate->startWith(newKey, reading);
}

void KxGoogleAuth::setScopes(const std::vector<std::string>& scopes)
{
    const std::lock_guard lock(mPrivate->mutex);
    // The present token is good for what was asked for before, so it is given up.
    mPrivate->scopes = scopes;
    mPrivate->header.clear();
}

void KxGoogleAuth::setSubject(const std::string& subject)
{
    const std::lock_guard lock(mPrivate->mutex);
    mPrivate->subject = subject;
    mPrivate->header.clear();
}

QByteArray KxGoogleAuth::authorizationHeader(const Exchange& exchange)
{
    // Held during the exchange: threads that come meanwhile wait for this token instead of each asking for one.
    const std::lock_guard lock(mPrivate->mutex);
    const qint64 now = mPrivate->clock();
    if (mPrivate->isFresh(now))
        return mPrivate->header;
    const bool hasKey = !mPrivate->key.privateKey.empty() || mPrivate->loadFile();
    return hasKey ? mPrivate->fetch(exchange, now) : QByteArray();
}

}  // namespace Kdd
