#include "server/access/SignIn.h"

#include "server/access/TokenClaims.h"
#include "server/http/StrictJson.h"

#include <QFile>
#include <QJsonArray>
#include <QJsonDocument>

#include <kddlib/LogFile.h>
#include <openssl/crypto.h>
#include <openssl/evp.h>
#include <openssl/rand.h>

namespace Kdd::Access
{
namespace
{

constexpr const char* kSession = "kdd-session";
constexpr const char* kBegun = "kdd-signin";
constexpr int kBegunLasts = 600;  // [s] for which the provider may ask for name and password
constexpr int kLongestTo = 1500;  // [bytes]; it has to find room in a cookie
constexpr int kLongestParameter = 4096;
constexpr int kMostCookies = 8;  // of one name: other hosts of the domain can add some
constexpr int kRandom = 32;      // [bytes]

QByteArray base64Url(const QByteArray& bytes)
{
    return bytes.toBase64(QByteArray::Base64UrlEncoding | QByteArray::OmitTrailingEquals);
}

/// Null when there are none to be had.
QByteArray randomText()
{
    QByteArray bytes(kRandom, '\0');
    return RAND_bytes(reinterpret_cast<uchar*>(bytes.data()), bytes.size()) == 1 ? base64Url(bytes)
                                                                                 : QByteArray();
}

QByteArray challengeOf(const QByteArray& verifier)
{
    QByteArray digest(EVP_MAX_MD_SIZE, '\0');
    unsigned int size = 0;
    EVP_Digest(verifier.constData(), static_cast<std::size_t>(verifier.size()),
               reinterpret_cast<uchar*>(digest.data()), &size, EVP_sha256(), nullptr);
    return base64Url(digest.left(static_cast<int>(size)));
}

bool isEqual(const QByteArray& a, const QByteArray& b)
{
    return a.size() == b.size() &&
           CRYPTO_memcmp(a.constData(), b.constData(), static_cast<std::size_t>(a.size())) == 0;
}

/// A path of this server; whatever else is asked for leads to the page.
QByteArray localPath(const QByteArray& to)
{
    for (const char each : to)
        if (each <= ' ' || each >= '\x7f' || each == '\\')
            return "/";
    return to.startsWith('/') && !to.startsWith("//") && to.size() <= kLongestTo ? to : QByteArray("/");
}

QVector<QByteArray> cookiesOf(const Http::Request& request, const QByteArray& name)
{
    QVector<QByteArray> values;
    for (const Http::Field& field : request.headers)
        if (field.name == "cookie")
            for (const QByteArray& pair : field.value.split(';'))
                if (const QByteArray each = pair.trimmed();
                    each.startsWith(name + '=') && values.size() < kMostCookies)
                    values.append(each.mid(name.size() + 1));
    return values;
}

/// Lax and not Strict: the provider sends browsers back from its own origin, and a link from elsewhere may lead to a study.
/// What changes something asks for more than the cookie.
void addCookie(const Http::Request& request, const QByteArray& name, const QByteArray& value,
               std::chrono::seconds age, Http::Response& response)
{
    const int start = request.base.indexOf('/', request.base.indexOf("://") + 3);
    const QByteArray path = (start < 0 ? QByteArray() : request.base.mid(start)) + '/';
    const bool isSecure = request.isEncrypted || request.base.startsWith("https://");
    response.addHeader("Set-Cookie", name + '=' + value + "; Path=" + path +
                                         "; HttpOnly; SameSite=Lax; Max-Age=" +
                                         QByteArray::number(static_cast<qlonglong>(age.count())) +
                                         (isSecure ? "; Secure" : ""));
}

/// In none of these addresses and answers is anything that others need to see or keep.
Http::Response closed(Http::Response response)
{
    response.addHeader("Cache-Control", "no-store");
    response.addHeader("Referrer-Policy", "no-referrer");
    return response;
}

Http::Response redirect(const QByteArray& address)
{
    Http::Response response(303);
    response.addHeader("Location", address);
    return closed(std::move(response));
}

Http::Response refused(int status, const QString& reason)
{
    return closed(Http::failure(status, reason));
}

std::chrono::seconds systemTime()
{
    return std::chrono::duration_cast<std::chrono::seconds>(
        std::chrono::system_clock::now().time_since_epoch());
}

TokenRules idTokenRules(const TokenRules& tokens, const SignInRules& rules)
{
    TokenRules made = tokens;
    made.audiences = {rules.client};
    return made;
}

bool hasExpired(const QJsonObject& object, std::chrono::seconds now)
{
    return object.value(QLatin1String("end")).toDouble() <= static_cast<double>(now.count());
}

}  // namespace

/// What is to be known when the browser comes back.
struct SignIn::Begun
{
    QByteArray state;
    QByteArray nonce;
    QByteArray verifier;
    QByteArray to;
};

std::unique_ptr<SignIn> SignIn::open(const TokenRules& tokens, const SignInRules& rules, Result& result)
{
    constexpr qint64 kLongestSecret = 4096;
    SessionSeal seal;
    QByteArray secret;
    result = SessionSeal::read(rules.sessionKeys, seal);
    if (result.good() && !rules.secretFile.isEmpty()) {
        QFile file(rules.secretFile);
        if (file.open(QIODevice::ReadOnly))
            secret = file.read(kLongestSecret).trimmed();
        if (secret.isEmpty())
            result = Result::failure(QStringLiteral("it has no secret: %1").arg(file.errorString()))
                         .within(rules.secretFile);
    }
    if (result.bad())
        return nullptr;
    return std::make_unique<SignIn>(tokens, rules, seal, secret, &systemTime);
}

SignIn::SignIn(const TokenRules& tokens, const SignInRules& rules, SessionSeal seal, QByteArray secret,
               ProviderKeys::Clock clock)
    : mTokens(tokens)
    , mRules(rules)
    , mSeal(std::move(seal))
    , mClock(std::move(clock))
    , mProvider(tokens, rules, std::move(secret))
    , mCheck(idTokenRules(tokens, rules), ProviderKeys::fetchOf(tokens), mClock)
{
}

bool SignIn::owns(const Http::Request& request)
{
    return request.path == QVector<QByteArray>{"signin"} ||
           request.path == QVector<QByteArray>{"signin", "callback"} ||
           request.path == QVector<QByteArray>{"signout"};
}

Http::Response SignIn::answer(const Http::Request& request)
{
    const bool isEnd = request.path.first() == "signout";
    if (request.method != (isEnd ? Http::Method::Post : Http::Method::Get)) {
        Http::Response response = refused(405, QStringLiteral("This is not asked for by that method"));
        response.addHeader("Allow", isEnd ? "POST" : "GET");
        return response;
    }
    if (isEnd)
        return end(request);
    return request.path.size() == 1 ? begin(request, request.parameter("to")) : finish(request);
}

// ---- to the provider

Http::Response SignIn::begin(const Http::Request& request, const QByteArray& to)
{
    ProviderAddresses where;
    const Result known = mProvider.addresses(where);
    const Begun begun = {randomText(), randomText(), randomText(), localPath(to)};
    const QJsonObject kept = {{QStringLiteral("state"), QString::fromLatin1(begun.state)},
                              {QStringLiteral("nonce"), QString::fromLatin1(begun.nonce)},
                              {QStringLiteral("verifier"), QString::fromLatin1(begun.verifier)},
                              {QStringLiteral("to"), QString::fromLatin1(begun.to)},
                              {QStringLiteral("end"), static_cast<qint64>(mClock().count()) + kBegunLasts}};
    const QByteArray sealed =
        mSeal.seal(SessionSeal::Purpose::SigningIn, QJsonDocument(kept).toJson(QJsonDocument::Compact));
    if (known.bad() || begun.verifier.isNull() || sealed.isNull()) {
        LogFile::errorf("Nobody can sign in: %s",
                        known.bad() ? qUtf8Printable(known.text()) : "there are no random numbers");
        return refused(503, QStringLiteral("Nobody can sign in now: the provider cannot be asked"));
    }
    const QByteArray query = formOf({{"response_type", "code"},
                                     {"client_id", mRules.client.toUtf8()},
                                     {"redirect_uri", request.base + "/signin/callback"},
                                     {"scope", mRules.scope.toUtf8()},
                                     {"state", begun.state},
                                     {"nonce", begun.nonce},
                                     {"code_challenge", challengeOf(begun.verifier)},
                                     {"code_challenge_method", "S256"}});
    Http::Response response =
        redirect(where.authorisation + (where.authorisation.contains('?') ? '&' : '?') + query);
    addCookie(request, kBegun, sealed, std::chrono::seconds(kBegunLasts), response);
    return response;
}

// ---- and back

bool SignIn::findBegun(const Http::Request& request, Begun& begun) const
{
    const QByteArray state = request.parameter("state");
    for (const QByteArray& sealed : cookiesOf(request, kBegun)) {
        QByteArray text;
        QJsonObject object;
        if (!mSeal.open(SessionSeal::Purpose::SigningIn, sealed, text) || !Http::parseObject(text, object) ||
            hasExpired(object, mClock()))
            continue;
        const auto member = [&](const char* name) {
            return object.value(QLatin1String(name)).toString().toLatin1();
        };
        begun = {member("state"), member("nonce"), member("verifier"), localPath(member("to"))};
        if (!begun.state.isEmpty() && isEqual(begun.state, state))
            return true;
    }
    return false;
}

Http::Response SignIn::finish(const Http::Request& request)
{
    Begun begun;
    Caller caller;
    for (const char* name : {"code", "state", "iss", "error"}) {
        const QVector<QByteArray> values = request.parameters(name);
        if (values.size() > 1 || (!values.isEmpty() && values.first().size() > kLongestParameter))
            return refused(400, QStringLiteral("The provider's answer says something twice, or too much"));
    }
    if (!findBegun(request, begun)) {
        // Of two windows that began at the same time the first one comes too late, and is in.
        if (identify(request, caller))
            return redirect(request.base + '/');
        return refused(400,
                       QStringLiteral("No sign-in has begun here that this would end, or it took too long"));
    }
    const QByteArray issuer = request.parameter("iss");
    Http::Response response;
    if (!issuer.isNull() && issuer != mTokens.issuer.toUtf8()) {
        response = refused(400, QStringLiteral("The answer is another provider's"));
    } else if (request.parameter("code").isEmpty()) {
        response = refused(403, QStringLiteral("The provider has not signed you in"));
    } else {
        QByteArray idToken;
        QByteArray session;
        const Result redeemed = mProvider.redeem(request.parameter("code"), begun.verifier,
                                                 request.base + "/signin/callback", idToken);
        QString fault;
        if (redeemed.bad())
            fault = QStringLiteral("The provider does not confirm it");
        else
            fault = faultOf(idToken, begun, session, caller);
        if (!fault.isEmpty())
            LogFile::warnf("Request %s: nobody is signed in: %s", request.id.constData(),
                           qUtf8Printable(redeemed.bad() ? redeemed.text() : fault));
        response = fault.isEmpty() ? redirect(request.base + begun.to)
                                   : refused(403, QStringLiteral("You are not signed in. ") + fault);
        if (fault.isEmpty())
            addCookie(request, kSession, session, mRules.session, response);
        response.caller = caller.subject;
    }
    // It is good for one time.
    addCookie(request, kBegun, {}, std::chrono::seconds(0), response);
    return response;
}

/// Empty, with the session and whose it is, when the token is one for us, now, and for what was begun.
QString SignIn::faultOf(const QByteArray& idToken, const Begun& begun, QByteArray& session, Caller& caller)
{
    QJsonObject claims;
    const TokenCheck::Verdict verdict = mCheck.read(idToken, claims);
    const auto member = [&](const char* name) { return claims.value(QLatin1String(name)); };
    if (verdict.isUndecidable)
        return QStringLiteral("The keys that tokens are signed with cannot be had now");
    if (!verdict.fault.isEmpty())
        return QString::fromLatin1(verdict.fault);
    if (!isEqual(member("nonce").toString().toUtf8(), begun.nonce))
        return QStringLiteral("The token answers another question");
    // One that is for several says for whom it was made.
    const bool isForSeveral = member("aud").toArray().size() > 1;
    if ((isForSeveral || !member("azp").isUndefined()) && member("azp") != mRules.client)
        return QStringLiteral("The token was made for others");
    const QJsonObject kept = {
        {QStringLiteral("claims"), keptOf(claims)},
        {QStringLiteral("end"), static_cast<qint64>((mClock() + mRules.session).count())}};
    session = mSeal.seal(SessionSeal::Purpose::Session, QJsonDocument(kept).toJson(QJsonDocument::Compact));
    if (session.isNull())
        return QStringLiteral("The provider says more of you than a cookie holds");
    caller = verdict.caller;
    return {};
}

/// What the rules ask of the claims, and nothing else: cookies are small.
QJsonObject SignIn::keptOf(const QJsonObject& claims) const
{
    QJsonObject kept = {{mTokens.subject, claimOf(claims, mTokens.subject)}};
    for (const ClaimLimit& limit : mTokens.studies)
        if (const QJsonValue value = claimOf(claims, limit.claim); !value.isUndefined())
            kept.insert(limit.claim, value);
    for (const ClaimRule& rule : mTokens.rights) {
        const QJsonValue known = kept.value(rule.claim);
        if (rule.claim.isEmpty() || (!known.isUndefined() && !known.isArray()) ||
            !claimHolds(claimOf(claims, rule.claim), rule.value))
            continue;
        QJsonArray values = known.toArray();
        if (!values.contains(rule.value))
            values.append(rule.value);
        kept.insert(rule.claim, values);
    }
    return kept;
}

// ---- afterwards

bool SignIn::identify(const Http::Request& request, Caller& caller) const
{
    for (const QByteArray& sealed : cookiesOf(request, kSession)) {
        QByteArray text;
        QJsonObject object;
        if (!mSeal.open(SessionSeal::Purpose::Session, sealed, text) || !Http::parseObject(text, object) ||
            hasExpired(object, mClock()) ||
            !callerOfClaims(object.value(QLatin1String("claims")).toObject(), mTokens, caller).isEmpty())
            continue;
        caller.isByCookie = true;
        return true;
    }
    return false;
}

Http::Response SignIn::end(const Http::Request& request)
{
    ProviderAddresses where;
    QByteArray to = request.base + '/';
    if (mProvider.addresses(where).good() && !where.endSession.isEmpty())
        to = where.endSession + (where.endSession.contains('?') ? '&' : '?') +
             formOf({{"client_id", mRules.client.toUtf8()}, {"post_logout_redirect_uri", to}});
    const QJsonObject answer = {{QStringLiteral("to"), QString::fromUtf8(to)}};
    Http::Response response = closed(
        Http::textResponse(200, "application/json", QJsonDocument(answer).toJson(QJsonDocument::Compact)));
    addCookie(request, kSession, {}, std::chrono::seconds(0), response);
    // The next one at this browser may see other studies.
    response.addHeader("Clear-Site-Data", "\"cache\"");
    return response;
}

}  // namespace Kdd::Access
