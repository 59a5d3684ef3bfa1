#pragma once

#include "server/access/Origins.h"
#include "server/access/RightsTable.h"
#include "server/access/TokenCheck.h"

namespace Kdd::Access
{

/// The one door: decides for every request who asks and whether he may, before anything else looks at it.
class AccessGate : public Http::Handler
{
public:
    /// `proxies` are the numeric addresses from which tokens are taken although the last part of their way is not
    /// encrypted. `inner` outlives this.
    AccessGate(const AccessRules& rules, RightsTable table, QVector<QByteArray> proxies,
               Http::Handler& inner);
    ~AccessGate() override;

    /// 401 for those who have to say who they are, or said it badly, 403 for those who may not, 404 and 405 for what is in
    /// no table, 503 when nobody can be known for want of keys. The answer tells who asked.
    Http::Response answer(const Http::Request& request) override;

private:
    Http::Response admit(const Http::Request& request);
    Http::Response decide(const Http::Request& request, const Asked& asked, const Caller& caller);
    bool identify(const Http::Request& request, Caller& caller, Http::Response& refusal);
    bool identifyByToken(const Http::Request& request, Caller& caller, Http::Response& refusal);
    Http::Response stranger() const;
    Http::Response noRight() const;
    Http::Request withoutSecrets(const Http::Request& request) const;

    AccessRules mRules;
    RightsTable mTable;
    QVector<QByteArray> mProxies;
    Origins mOrigins;
    std::unique_ptr<TokenCheck> mTokens;
    Http::Handler& mInner;
};

}  // namespace Kdd::Access
