#pragma once

#include "server/access/AccessRules.h"

#include <QJsonObject>

namespace Kdd::Access
{

/// A claim by its name, or by a path with points into objects.
QJsonValue claimOf(const QJsonObject& claims, const QString& path);

/// Whether it is the value, a list that has it, or a text of words one of which it is.
bool claimHolds(const QJsonValue& claim, const QString& value);

/// What the claims of a token that is signed well say against it at a time; empty when nothing does. `until` is when they
/// end.
QByteArray faultOfClaims(const QJsonObject& claims, const TokenRules& rules, std::chrono::seconds now,
                         std::chrono::seconds& until);

/// Whom the claims name, and what he may do and see; the fault, with the caller as it was, when they name nobody.
QByteArray callerOfClaims(const QJsonObject& claims, const TokenRules& rules, Caller& caller);

}  // namespace Kdd::Access
