#pragma once

#include "server/access/AccessRules.h"

#include <mutex>

namespace Kdd::Access
{

/// Where a provider is asked for what.
struct ProviderAddresses
{
    QByteArray authorisation;  ///< where browsers are sent
    QByteArray token;          ///< where we redeem what they bring back
    QByteArray endSession;     ///< where they sign out; empty: nowhere

    /// Of the text in which a provider tells of itself. Failure: it is none, or that of another issuer.
    static Result parse(const QByteArray& text, const QString& issuer, ProviderAddresses& addresses);
};

/// An OpenID Connect provider. What it tells of itself is fetched when it is first needed, and again when it is old; while it
/// cannot be had the former serves. May be used on any thread.
class SignInProvider
{
public:
    SignInProvider(const TokenRules& tokens, const SignInRules& rules, QByteArray secret);

    /// Failure: it cannot be asked, and never was.
    Result addresses(ProviderAddresses& found);

    /// The ID token for a code that a browser brought back. `redirect` is where it was sent, `verifier` what the code was
    /// asked for with. Failure tells neither.
    Result redeem(const QByteArray& code, const QByteArray& verifier, const QByteArray& redirect,
                  QByteArray& idToken);

private:
    const TokenRules mTokens;
    const SignInRules mRules;
    const QByteArray mSecret;
    std::mutex mMutex;  // held while it is fetched: without it nobody gets further
    ProviderAddresses mAddresses;
    std::chrono::steady_clock::time_point mFetched;
    std::chrono::steady_clock::time_point mTried;
};

/// Names and values as they stand in a query or a form.
QByteArray formOf(const QVector<QPair<QByteArray, QByteArray>>& fields);

}  // namespace Kdd::Access
