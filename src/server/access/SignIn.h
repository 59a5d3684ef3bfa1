#pragma once

#include "server/access/SessionSeal.h"
#include "server/access/SignInProvider.h"
#include "server/access/TokenCheck.h"
#include "server/http/Response.h"

namespace Kdd::Access
{

/// Signs people in with their browsers at an OpenID Connect provider (code flow with PKCE), and knows them by a cookie
/// afterwards. Everything that is to be remembered stands sealed in cookies, so that any server can go on where another
/// began. May be used on any thread.
///
///     GET /signin?to=/PATH     to the provider, and afterwards to that path of this server
///     GET /signin/callback     where the provider sends browsers back
///     POST /signout            {"to": ADDRESS}, where the provider's own session ends
class SignIn
{
public:
    /// Null, with the reason, when the files that the rules name cannot be used.
    static std::unique_ptr<SignIn> open(const TokenRules& tokens, const SignInRules& rules, Result& result);

    SignIn(const TokenRules& tokens, const SignInRules& rules, SessionSeal seal, QByteArray secret,
           ProviderKeys::Clock clock);

    static bool owns(const Http::Request& request);
    Http::Response answer(const Http::Request& request);

    /// Whether somebody has signed in whose session has not expired.
    bool identify(const Http::Request& request, Caller& caller) const;

    /// Sends the browser to the provider, and afterwards back to the path.
    Http::Response begin(const Http::Request& request, const QByteArray& to);

private:
    struct Begun;

    Http::Response finish(const Http::Request& request);
    Http::Response end(const Http::Request& request);
    bool findBegun(const Http::Request& request, Begun& begun) const;
    QString faultOf(const QByteArray& idToken, const Begun& begun, QByteArray& session, Caller& caller);
    QJsonObject keptOf(const QJsonObject& claims) const;

    const TokenRules mTokens;
    const SignInRules mRules;
    const SessionSeal mSeal;
    const ProviderKeys::Clock mClock;
    SignInProvider mProvider;
    TokenCheck mCheck;
};

}  // namespace Kdd::Access
