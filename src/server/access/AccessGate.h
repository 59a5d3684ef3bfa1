#pragma once

#include "server/access/Origins.h"
#include "server/access/RightsTable.h"
#include "server/access/SignIn.h"
#include "server/access/TokenCheck.h"
#include "server/dicomweb/search/StudySight.h"

#include <functional>

namespace Kdd::Access
{

/// The one door: decides for every request who asks and whether he may, before anything else looks at it.
class AccessGate : public Http::Handler
{
public:
    /// Whether a study is within the limits of whoever asks.
    using Look = std::function<DicomWeb::Sight(const DicomWeb::StudySight::Limits&, const QByteArray& study)>;

    /// `proxies` are the numeric addresses from which tokens are taken although the last part of their way is not
    /// encrypted. Without `signIn` nobody signs in here. `inner` outlives this.
    AccessGate(const AccessRules& rules, RightsTable table, QVector<QByteArray> proxies, Look look,
               std::unique_ptr<SignIn> signIn, Http::Handler& inner);
    ~AccessGate() override;

    /// 401 for those who have to say who they are, or said it badly, 403 for those who may not, 404 and 405 for what is in
    /// no table, 503 when nobody can be known for want of keys. The answer tells who asked.
    Http::Response answer(const Http::Request& request) override;

private:
    bool isSecret(const Http::Request& request) const;
    Http::Response signInOrOut(const Http::Request& request);
    bool hasToSignIn(const Http::Request& request, const Asked& asked);
    Http::Response admit(const Http::Request& request);
    Http::Response passOn(const Http::Request& request, const Asked& asked, const Caller& caller);
    Http::Response otherMethod(const Http::Request& request);
    Http::Response decide(const Http::Request& request, const Asked& asked, const Caller& caller);
    bool identify(const Http::Request& request, Caller& caller, Http::Response& refusal);
    bool identifyByToken(const Http::Request& request, Caller& caller, Http::Response& refusal);
    Http::Response stranger(const Http::Request& request) const;
    Http::Response noRight() const;
    Http::Request withoutSecrets(const Http::Request& request) const;

    AccessRules mRules;
    RightsTable mTable;
    QVector<QByteArray> mProxies;
    Origins mOrigins;
    std::unique_ptr<TokenCheck> mTokens;
    std::unique_ptr<SignIn> mSignIn;
    const Look mLook;
    const QByteArray mNoStudy;  // a name that no study has
    Http::Handler& mInner;
};

}  // namespace Kdd::Access
