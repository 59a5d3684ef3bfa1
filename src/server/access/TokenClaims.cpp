#include "server/access/TokenClaims.h"

#include <QJsonArray>

#include <algorithm>
#include <optional>

namespace Kdd::Access
{
namespace
{

constexpr double kLatest = 1e12;      // [s since 1970]; nothing that is added to it overflows
constexpr int kMostValues = 500;      // of a claim that limits studies; each is held against every study
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

/// What stands in the way of all studies; false when there is too much of it.
bool limitsOf(const QJsonObject& claims, const TokenRules& rules, Kxg::StudyLimits& limits)
{
    for (const ClaimLimit& each : rules.studies) {
        const QJsonValue claim = claimOf(claims, each.claim);
        QStringList values;
        const QJsonArray items = claim.isArray() ? claim.toArray() : QJsonArray{claim};
        for (const QJsonValue item : items)
            values.append(item.toString());
        if (values.size() > kMostValues)
            return false;
        if (!values.contains(QStringLiteral("*")))
            limits.all.push_back(each.rule.limit(values));
    }
    return true;
}

bool isMeantFor(const QJsonValue& audience, const QVector<QString>& audiences)
{
    return std::any_of(audiences.begin(), audiences.end(), [&](const QString& each) {
        return audience.isArray() ? audience.toArray().contains(each) : audience == each;
    });
}

}  // namespace

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

bool claimHolds(const QJsonValue& claim, const QString& value)
{
    if (claim.isArray())
        return claim.toArray().contains(value);
    return claim.isString() && claim.toString().split(QLatin1Char(' ')).contains(value);
}

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

QByteArray callerOfClaims(const QJsonObject& claims, const TokenRules& rules, Caller& caller)
{
    Caller made;
    Kxg::StudyLimits limits;
    const QString subject = claimOf(claims, rules.subject).toString();
    if (subject.isEmpty() || subject.size() > kLongestSubject)
        return "The token names nobody";
    if (!limitsOf(claims, rules, limits))
        return "The token is for too many studies";
    made.subject = subject.toUtf8();
    for (const ClaimRule& rule : rules.rights)
        if (rule.claim.isEmpty() || claimHolds(claimOf(claims, rule.claim), rule.value))
            made.rights |= rule.gives;
    if (!limits.all.empty())
        made.studies = std::make_shared<const Kxg::StudyLimits>(std::move(limits));
    caller = made;
    return {};
}

}  // namespace Kdd::Access
