#include "server/access/TokenKeys.h"

#include "server/access/Base64Url.h"
#include "server/http/StrictJson.h"

#include <QJsonArray>

#include <openssl/bn.h>
#include <openssl/core_names.h>
#include <openssl/ec.h>
#include <openssl/err.h>
#include <openssl/evp.h>
#include <openssl/param_build.h>

#include <algorithm>

namespace Kdd::Access
{
namespace
{

constexpr int kMostKeys = 100;
constexpr int kLeastBits = 2048;  // of RSA; what is shorter can be broken
constexpr int kMostBits = 8192;   // what is longer takes too long with every token
constexpr int kMostExponent = 8;  // [bytes]
constexpr int kCoordinate = 32;   // [bytes] of a point of P-256, and of each half of a signature

struct Release
{
    void operator()(BIGNUM* number) const { BN_free(number); }
    void operator()(ECDSA_SIG* signature) const { ECDSA_SIG_free(signature); }
    void operator()(EVP_MD_CTX* context) const { EVP_MD_CTX_free(context); }
    void operator()(EVP_PKEY_CTX* context) const { EVP_PKEY_CTX_free(context); }
    void operator()(OSSL_PARAM* parameters) const { OSSL_PARAM_free(parameters); }
    void operator()(OSSL_PARAM_BLD* builder) const { OSSL_PARAM_BLD_free(builder); }
};

template <typename Object>
using Owner = std::unique_ptr<Object, Release>;

const uchar* bytesOf(const QByteArray& bytes)
{
    return reinterpret_cast<const uchar*>(bytes.constData());
}

Owner<BIGNUM> numberOf(const QByteArray& bytes)
{
    return Owner<BIGNUM>(BN_bin2bn(bytesOf(bytes), bytes.size(), nullptr));
}

QByteArray memberOf(const QJsonObject& object, const char* name)
{
    return object.value(QLatin1String(name)).toString().toUtf8();
}

bool decodeMember(const QJsonObject& object, const char* name, QByteArray& bytes)
{
    return decodeBase64Url(memberOf(object, name), bytes) && !bytes.isEmpty();
}

std::shared_ptr<EVP_PKEY> make(const char* type, OSSL_PARAM_BLD* builder)
{
    const Owner<OSSL_PARAM> parameters(OSSL_PARAM_BLD_to_param(builder));
    const Owner<EVP_PKEY_CTX> context(EVP_PKEY_CTX_new_from_name(nullptr, type, nullptr));
    EVP_PKEY* key = nullptr;
    if (parameters != nullptr && context != nullptr && EVP_PKEY_fromdata_init(context.get()) == 1)
        EVP_PKEY_fromdata(context.get(), &key, EVP_PKEY_PUBLIC_KEY, parameters.get());
    return {key, EVP_PKEY_free};
}

std::shared_ptr<EVP_PKEY> makeRsa(const QJsonObject& member)
{
    QByteArray modulus;
    QByteArray exponent;
    if (!decodeMember(member, "n", modulus) || !decodeMember(member, "e", exponent) ||
        modulus.size() > kMostBits / 8 + 1 || exponent.size() > kMostExponent)
        return nullptr;
    const Owner<BIGNUM> n = numberOf(modulus);
    const Owner<BIGNUM> e = numberOf(exponent);
    const Owner<OSSL_PARAM_BLD> builder(OSSL_PARAM_BLD_new());
    if (n == nullptr || e == nullptr || builder == nullptr || BN_num_bits(n.get()) < kLeastBits ||
        BN_num_bits(n.get()) > kMostBits || BN_is_odd(n.get()) == 0 || BN_is_odd(e.get()) == 0 ||
        BN_is_one(e.get()) != 0 ||
        OSSL_PARAM_BLD_push_BN(builder.get(), OSSL_PKEY_PARAM_RSA_N, n.get()) != 1 ||
        OSSL_PARAM_BLD_push_BN(builder.get(), OSSL_PKEY_PARAM_RSA_E, e.get()) != 1)
        return nullptr;
    return make("RSA", builder.get());
}

std::shared_ptr<EVP_PKEY> makeEc(const QJsonObject& member)
{
    QByteArray x;
    QByteArray y;
    if (memberOf(member, "crv") != "P-256" || !decodeMember(member, "x", x) ||
        !decodeMember(member, "y", y) || x.size() != kCoordinate || y.size() != kCoordinate)
        return nullptr;
    const QByteArray point = '\x04' + x + y;
    const Owner<OSSL_PARAM_BLD> builder(OSSL_PARAM_BLD_new());
    if (builder == nullptr ||
        OSSL_PARAM_BLD_push_utf8_string(builder.get(), OSSL_PKEY_PARAM_GROUP_NAME, "prime256v1", 0) != 1 ||
        OSSL_PARAM_BLD_push_octet_string(builder.get(), OSSL_PKEY_PARAM_PUB_KEY, point.constData(),
                                         static_cast<std::size_t>(point.size())) != 1)
        return nullptr;
    // A point that is none of the curve's makes no key.
    return make("EC", builder.get());
}

/// Whether a key is for signatures of that kind, as far as it says.
bool isMeantFor(const QJsonObject& member, const char* algorithm)
{
    const QJsonValue operations = member.value(QLatin1String("key_ops"));
    const QByteArray use = memberOf(member, "use");
    const QByteArray named = memberOf(member, "alg");
    return (use.isEmpty() || use == "sig") && (named.isEmpty() || named == algorithm) &&
           (operations.isUndefined() || operations.toArray().contains(QStringLiteral("verify")));
}

/// Two numbers side by side, as the library wants them.
QByteArray derSignature(const QByteArray& signature)
{
    if (signature.size() != 2 * kCoordinate)
        return {};
    Owner<BIGNUM> r = numberOf(signature.left(kCoordinate));
    Owner<BIGNUM> s = numberOf(signature.mid(kCoordinate));
    const Owner<ECDSA_SIG> pair(ECDSA_SIG_new());
    if (r == nullptr || s == nullptr || pair == nullptr || ECDSA_SIG_set0(pair.get(), r.get(), s.get()) != 1)
        return {};
    static_cast<void>(r.release());
    static_cast<void>(s.release());
    QByteArray der(i2d_ECDSA_SIG(pair.get(), nullptr), '\0');
    auto* to = reinterpret_cast<uchar*>(der.data());
    i2d_ECDSA_SIG(pair.get(), &to);
    return der;
}

}  // namespace

std::shared_ptr<const TokenKeys> TokenKeys::read(const QByteArray& text, Result& result)
{
    QJsonObject set;
    const auto keys = std::make_shared<TokenKeys>();
    result = {};
    if (!Http::parseObject(text, set) || !set.value(QLatin1String("keys")).isArray()) {
        result = Result::failure(QStringLiteral("it is no set of keys"));
        return nullptr;
    }
    const QJsonArray members = set.value(QLatin1String("keys")).toArray();
    for (int i = 0; i < std::min(members.size(), kMostKeys); ++i) {
        const QJsonObject member = members[i].toObject();
        const QByteArray type = memberOf(member, "kty");
        Key key = {memberOf(member, "kid"), type == "EC" ? Algorithm::ES256 : Algorithm::RS256, nullptr};
        if (type == "RSA" && isMeantFor(member, "RS256"))
            key.key = makeRsa(member);
        else if (type == "EC" && isMeantFor(member, "ES256"))
            key.key = makeEc(member);
        if (key.key != nullptr)
            keys->mKeys.append(key);
    }
    // What OpenSSL noted must not be taken for somebody else's fault.
    ERR_clear_error();
    if (keys->mKeys.isEmpty()) {
        result = Result::failure(QStringLiteral("it has no key for RS256 or ES256"));
        return nullptr;
    }
    return keys;
}

const TokenKeys::Key* TokenKeys::find(const QByteArray& id, Algorithm algorithm) const
{
    const Key* found = nullptr;
    for (const Key& key : mKeys) {
        if (key.algorithm != algorithm || (!id.isEmpty() && key.id != id))
            continue;
        // Of several nobody knows which is meant.
        if (found != nullptr)
            return nullptr;
        found = &key;
    }
    return found;
}

bool TokenKeys::verify(const QByteArray& id, Algorithm algorithm, const QByteArray& text,
                       const QByteArray& signature) const
{
    const Key* const key = find(id, algorithm);
    const QByteArray form = algorithm == Algorithm::ES256 ? derSignature(signature) : signature;
    const Owner<EVP_MD_CTX> context(EVP_MD_CTX_new());
    const bool isGood =
        key != nullptr && !form.isEmpty() && context != nullptr &&
        EVP_DigestVerifyInit(context.get(), nullptr, EVP_sha256(), nullptr, key->key.get()) == 1 &&
        EVP_DigestVerify(context.get(), bytesOf(form), static_cast<std::size_t>(form.size()), bytesOf(text),
                         static_cast<std::size_t>(text.size())) == 1;
    ERR_clear_error();
    return isGood;
}

}  // namespace Kdd::Access
