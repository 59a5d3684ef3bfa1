#include "server/access/TokenCheck.h"

#include "server/access/SignedToken.h"
#include "server/access/TokenClaims.h"

#include <openssl/evp.h>

namespace Kdd::Access
{
namespace
{

/// Tokens that are known at a time, each with 200 bytes or so. Beyond it all are forgotten, which costs each one
/// signature.
constexpr int kMostKnown = 20000;

QByteArray digestOf(const QByteArray& token)
{
    QByteArray digest(EVP_MAX_MD_SIZE, '\0');
    unsigned int size = 0;
    if (EVP_Digest(token.constData(), static_cast<std::size_t>(token.size()),
                   reinterpret_cast<uchar*>(digest.data()), &size, EVP_sha256(), nullptr) != 1)
        return {};
    digest.truncate(static_cast<int>(size));
    return digest;
}

std::chrono::seconds systemTime()
{
    return std::chrono::duration_cast<std::chrono::seconds>(
        std::chrono::system_clock::now().time_since_epoch());
}

TokenCheck::Verdict refusal(const char* fault)
{
    TokenCheck::Verdict verdict;
    verdict.fault = fault;
    return verdict;
}

TokenCheck::Verdict undecidable()
{
    TokenCheck::Verdict verdict;
    verdict.isUndecidable = true;
    return verdict;
}

}  // namespace

TokenCheck::TokenCheck(const TokenRules& rules, ProviderKeys::Fetch fetch, ProviderKeys::Clock clock)
    : mRules(rules)
    , mClock(clock)
    , mKeys(rules, std::move(fetch), std::move(clock))
{
}

TokenCheck::TokenCheck(const TokenRules& rules)
    : TokenCheck(rules, ProviderKeys::fetchOf(rules), &systemTime)
{
}

TokenCheck::Verdict TokenCheck::check(const QByteArray& token)
{
    const std::shared_ptr<const TokenKeys> keys = mKeys.present();
    const QByteArray digest = digestOf(token);
    Verdict verdict;
    if (keys == nullptr || digest.isEmpty())
        return undecidable();
    if (find(digest, keys, verdict.caller))
        return verdict;
    std::shared_ptr<const TokenKeys> by = keys;
    Known known;
    QJsonObject claims;
    verdict = verify(token, by, known.until, claims);
    known.caller = verdict.caller;
    if (verdict.fault.isEmpty() && !verdict.isUndecidable)
        keep(digest, by, known);
    return verdict;
}

TokenCheck::Verdict TokenCheck::read(const QByteArray& token, QJsonObject& claims)
{
    claims = {};
    std::chrono::seconds until{};
    std::shared_ptr<const TokenKeys> keys = mKeys.present();
    return keys == nullptr ? undecidable() : verify(token, keys, until, claims);
}

/// `keys` become those that it was verified with.
TokenCheck::Verdict TokenCheck::verify(const QByteArray& token, std::shared_ptr<const TokenKeys>& keys,
                                       std::chrono::seconds& until, QJsonObject& claims)
{
    SignedToken read;
    Verdict verdict;
    if (!SignedToken::parse(token, read))
        return refusal("The token cannot be read");
    // A provider that changes its keys signs with ones that are not known yet.
    if (!keys->has(read.keyId, read.algorithm))
        keys = mKeys.newerThan(keys);
    if (keys == nullptr)
        return undecidable();
    if (!keys->has(read.keyId, read.algorithm))
        return refusal("The key of the token is not known");
    if (!keys->verify(read.keyId, read.algorithm, read.text, read.signature))
        return refusal("The signature of the token is not good");
    verdict.fault = faultOfClaims(read.claims, mRules, mClock(), until);
    if (verdict.fault.isEmpty())
        verdict.fault = callerOfClaims(read.claims, mRules, verdict.caller);
    if (!verdict.fault.isEmpty())
        return refusal(verdict.fault.constData());
    claims = read.claims;
    return verdict;
}

bool TokenCheck::find(const QByteArray& digest, const std::shared_ptr<const TokenKeys>& keys, Caller& caller)
{
    const std::lock_guard<std::mutex> lock(mMutex);
    const auto known = mKnownBy == keys ? mKnown.constFind(digest) : mKnown.constEnd();
    if (known == mKnown.constEnd() || mClock() >= known->until)
        return false;
    caller = known->caller;
    return true;
}

void TokenCheck::keep(const QByteArray& digest, const std::shared_ptr<const TokenKeys>& keys,
                      const Known& known)
{
    const std::lock_guard<std::mutex> lock(mMutex);
    // A key that was taken back takes its tokens with it.
    if (mKnownBy != keys || mKnown.size() >= kMostKnown)
        mKnown.clear();
    mKnownBy = keys;
    mKnown.insert(digest, known);
}

}  // namespace Kdd::Access
