#pragma once

#include "server/access/ProviderKeys.h"

#include <QJsonObject>

namespace Kdd::Access
{

/// Whether tokens are good, and for whom and what. Those that were found good are known by their digest until they expire,
/// so that a signature is verified once and not with every request. May be used on any thread.
class TokenCheck
{
public:
    TokenCheck(const TokenRules& rules, ProviderKeys::Fetch fetch, ProviderKeys::Clock clock);

    /// With the rules' own place of the keys, and the system's clock.
    explicit TokenCheck(const TokenRules& rules);

    struct Verdict
    {
        Caller caller;
        QByteArray fault;            ///< why the token is not good, for its sender; empty when it is
        bool isUndecidable = false;  ///< there are no keys to judge it by
    };

    Verdict check(const QByteArray& token);

    /// The same with what the token says, which is empty when it is not good. Nothing is remembered of it.
    Verdict read(const QByteArray& token, QJsonObject& claims);

private:
    struct Known
    {
        Caller caller;
        std::chrono::seconds until{};
    };

    Verdict verify(const QByteArray& token, std::shared_ptr<const TokenKeys>& keys,
                   std::chrono::seconds& until, QJsonObject& claims);
    bool find(const QByteArray& digest, const std::shared_ptr<const TokenKeys>& keys, Caller& caller);
    void keep(const QByteArray& digest, const std::shared_ptr<const TokenKeys>& keys, const Known& known);

    const TokenRules mRules;
    const ProviderKeys::Clock mClock;
    ProviderKeys mKeys;
    std::mutex mMutex;
    std::shared_ptr<const TokenKeys> mKnownBy;  // the keys that all of these were verified with
    QHash<QByteArray, Known> mKnown;            // by digest
};

}  // namespace Kdd::Access
