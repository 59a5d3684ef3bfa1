#include "server/access/TokenClaims.h"

#include <QJsonArray>

#include <algorithm>
#include <optional>

namespace Kdd::Access
{
namespace
{

constexpr double kLatest = 1e12;      // [s since 1970]; nothing that is added to it overflows
constexpr int kLongestSubject = 256;  // characters; it stands in every line of the audit trail

/// Null when it is no moment; nothing when there is none.
std::optional<double> momentOf(const QJsonObject& claims, const char* name, bool& isWrong)
{
    const QJsonValue value = claims.value(QLatin1String(name));
    if (value.isUndefined())
        return std::nullopt;
    const double moment = value.toDouble(-1);
    isWrong = isWrong || !(moment >= 0 && moment <= kLatest);
    return moment;
}

QJsonValue claimOf(const QJsonObject& claims, const QString& path)
{
    // Providers name claims by addresses, with points in them.
    if (claims.contains(path))
        return claims.value(path);
    QJsonValue value = claims;
    for (const QString& name : path.split(QLatin1Char('.')))
        value = value.toObject().value(name);
    return value;
}

bool holds(const QJsonValue& claim, const QString& value)
{
    if (claim.isArray())
        return claim.toArray().contains(value);
    return claim.isString() && claim.toString().split(QLatin1Char(' ')).contains(value);
}

bool isMeantFor(const QJsonValue& audience, const QVector<QString>& audiences)
{
    return std::any_of(audiences.begin(), audiences.end(), [&](const QString& each) {
        return audience.isArray() ? audience.toArray().contains(each) : audience == each;
    });
}

}  // namespace

QByteArray faultOfClaims(const QJsonObject& claims, const TokenRules& rules, std::chrono::seconds now,
                         std::chrono::seconds& until)
{
    bool isWrong = false;
    const std::optional<double> expires = momentOf(claims, "exp", isWrong);
    const std::optional<double> begins = momentOf(claims, "nbf", isWrong);
    const std::optional<double> issued = momentOf(claims, "iat", isWrong);
    const auto present = static_cast<double>(now.count());
    const auto leeway = static_cast<double>(rules.leeway.count());
    if (claims.value(QLatin1String("iss")) != rules.issuer)
        return "The token is of another issuer";
    if (!isMeantFor(claims.value(QLatin1String("aud")), rules.audiences))
        return "The token is meant for others";
    if (isWrong || !expires)
        return "The token does not say from when to when it is good";
    if (*expires + leeway <= present)
        return "The token has expired";
    if (std::max(begins.value_or(0), issued.value_or(0)) > present + leeway)
        return "The token is not good yet";
    until = std::chrono::seconds(static_cast<qint64>(*expires + leeway));
    return {};
}

bool callerOfClaims(const QJsonObject& claims, const TokenRules& rules, Caller& caller)
{
    const QString subject = claimOf(claims, rules.subject).toString();
    if (subject.isEmpty() || subject.size() > kLongestSubject)
        return false;
    caller.subject = subject.toUtf8();
    caller.rights = {};
    for (const ClaimRule& rule : rules.rights)
        if (rule.claim.isEmpty() || holds(claimOf(claims, rule.claim), rule.value))
            caller.rights |= rule.gives;
    return true;
}

}  // namespace Kdd::Access
