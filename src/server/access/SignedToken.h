#pragma once

#include "server/access/TokenKeys.h"

#include <QJsonObject>

namespace Kdd::Access
{

/// A token of three parts (a signed JWT in its compact form), taken apart. Nothing of it is true before its signature is
/// verified.
struct SignedToken
{
    QByteArray keyId;  ///< of the key that it says to be signed with; empty: it does not say
    Algorithm algorithm = Algorithm::RS256;
    QJsonObject claims;
    QByteArray text;  ///< that is signed
    QByteArray signature;

    /// False when it is not in this form to the last letter, signed in another way than those we know, or wants something
    /// to be understood that we do not.
    static bool parse(const QByteArray& token, SignedToken& read);
};

}  // namespace Kdd::Access
