#include "server/access/SignInProvider.h"

#include "server/access/HostName.h"
#include "server/http/StrictJson.h"

#include <kddlib/KxCurlClient.h>

#include <algorithm>

namespace Kdd::Access
{
namespace
{

constexpr qint64 kLongestAnswer = 256 * 1024;  // [bytes]; tokens and descriptions have some 10 KiB at most
constexpr int kLongestAddress = 2000;

/// People wait for it, each with a thread of ours.
constexpr auto kPatience = std::chrono::seconds(15);
constexpr auto kPause = std::chrono::seconds(10);

/// Browsers are sent there, and codes and secrets: never without encryption but to this machine.
bool isAddress(const QByteArray& text)
{
    const int start = text.indexOf("://") + 3;
    const int end = text.indexOf('/', start);
    const QByteArray host = hostOf(text.mid(start, end < 0 ? -1 : end - start));
    const bool isPlain = std::all_of(text.begin(), text.end(), [](char each) {
        return each > ' ' && each < '\x7f' && each != '"' && each != '\\' && each != '#';
    });
    return isPlain && text.size() <= kLongestAddress && !host.isEmpty() &&
           (text.startsWith("https://") || (text.startsWith("http://") && isLoopbackName(host)));
}

QByteArray addressOf(const QJsonObject& object, const char* name)
{
    const QByteArray address = object.value(QLatin1String(name)).toString().toUtf8();
    return isAddress(address) ? address : QByteArray();
}

}  // namespace

QByteArray formOf(const QVector<QPair<QByteArray, QByteArray>>& fields)
{
    QByteArray form;
    for (const auto& field : fields)
        form += (form.isEmpty() ? "" : "&") + field.first + '=' + field.second.toPercentEncoding();
    return form;
}

Result ProviderAddresses::parse(const QByteArray& text, const QString& issuer, ProviderAddresses& addresses)
{
    QJsonObject object;
    if (!Http::parseObject(text, object))
        return Result::failure(QStringLiteral("it is no JSON object, or says something twice"));
    if (object.value(QLatin1String("issuer")) != issuer)
        return Result::failure(QStringLiteral("it is of another issuer"));
    ProviderAddresses made;
    made.authorisation = addressOf(object, "authorization_endpoint");
    made.token = addressOf(object, "token_endpoint");
    made.endSession = addressOf(object, "end_session_endpoint");
    if (made.authorisation.isEmpty() || made.token.isEmpty())
        return Result::failure(QStringLiteral("it names no addresses of HTTPS for authorisation and tokens"));
    addresses = made;
    return {};
}

SignInProvider::SignInProvider(const TokenRules& tokens, const SignInRules& rules, QByteArray secret)
    : mTokens(tokens)
    , mRules(rules)
    , mSecret(std::move(secret))
{
}

Result SignInProvider::addresses(ProviderAddresses& found)
{
    const std::lock_guard<std::mutex> lock(mMutex);
    const auto now = std::chrono::steady_clock::now();
    const bool isKnown = !mAddresses.token.isEmpty();
    const bool isOld = !isKnown || now - mFetched >= mTokens.keysAge;
    Result result;
    if (isOld && (mTried.time_since_epoch().count() == 0 || now - mTried >= kPause)) {
        QByteArray text;
        result = KxCurlClient::instance().readTrusted(mRules.discovery.toStdString(), mTokens.caFile,
                                                      kLongestAnswer, kPatience, text);
        if (result.good())
            result = ProviderAddresses::parse(text, mTokens.issuer, mAddresses)
                         .within(QString::fromUtf8(mRules.discovery));
        mTried = now;
        if (result.good())
            mFetched = now;
    }
    if (mAddresses.token.isEmpty())
        return result.bad() ? result : Result::failure(QStringLiteral("it was asked a moment ago, in vain"));
    found = mAddresses;
    return {};
}

Result SignInProvider::redeem(const QByteArray& code, const QByteArray& verifier, const QByteArray& redirect,
                              QByteArray& idToken)
{
    ProviderAddresses where;
    Result result = addresses(where);
    if (result.bad())
        return result;
    const QByteArray client = mRules.client.toUtf8();
    const QByteArray form = formOf({{"grant_type", "authorization_code"},
                                    {"code", code},
                                    {"redirect_uri", redirect},
                                    {"client_id", client},
                                    {"code_verifier", verifier}});
    std::vector<std::string> headers = {"Content-Type: application/x-www-form-urlencoded"};
    if (!mSecret.isEmpty()) {
        const QByteArray pair = client.toPercentEncoding() + ':' + mSecret.toPercentEncoding();
        headers.push_back("Authorization: Basic " + pair.toBase64().toStdString());
    }
    QByteArray text;
    QJsonObject answer;
    result = KxCurlClient::instance().postTrusted(where.token.toStdString(), mTokens.caFile, headers, form,
                                                  kLongestAnswer, kPatience, text);
    if (result.bad())
        return result;
    if (!Http::parseObject(text, answer) || !answer.value(QLatin1String("id_token")).isString())
        return Result::failure(QStringLiteral("it answered without an ID token"))
            .within(QString::fromUtf8(where.token));
    idToken = answer.value(QLatin1String("id_token")).toString().toUtf8();
    return {};
}

}  // namespace Kdd::Access
