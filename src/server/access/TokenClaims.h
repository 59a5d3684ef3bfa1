#pragma once

#include "server/access/AccessRules.h"

#include <QJsonObject>

namespace Kdd::Access
{

/// What the claims of a token that is signed well say against it at a time; empty when nothing does. `until` is when they
/// end.
QByteArray faultOfClaims(const QJsonObject& claims, const TokenRules& rules, std::chrono::seconds now,
                         std::chrono::seconds& until);

/// Whom the claims name and what he may do. False when they name nobody.
bool callerOfClaims(const QJsonObject& claims, const TokenRules& rules, Caller& caller);

}  // namespace Kdd::Access
