#include "kddlib/net/cloud/JsonWebToken.h"

#include "platform/base/Result.h"

#include <QJsonDocument>
#include <QJsonObject>

#include <openssl/bio.h>
#include <openssl/err.h>
#include <openssl/evp.h>
#include <openssl/pem.h>

#include <memory>

namespace Kdd
{
namespace
{

/// What OpenSSL itself verifies with; signing takes time with the cube of it, and a key comes from outside.
constexpr int kMaxKeyBits = 16384;

struct Release
{
    void operator()(EVP_MD_CTX* context) const { EVP_MD_CTX_destroy(context); }
    void operator()(BIO* buffer) const { BIO_free(buffer); }
    void operator()(EVP_PKEY* key) const { EVP_PKEY_free(key); }
};

template <typename Object>
using Owner = std::unique_ptr<Object, Release>;

/// What OpenSSL noted must not stay: the next user of this thread, curl, would take it for its own fault.
Result failure(const char* reason)
{
    ERR_clear_error();
    return Result::failure(QString::fromLatin1(reason));
}

/// A server has nobody to ask, and OpenSSL would ask on the terminal.
int noPassphrase(char* /*buffer*/, int /*size*/, int /*writes*/, void* /*data*/)
{
    return 0;
}

Owner<EVP_PKEY> readRsaKey(BIO* pem)
{
    Owner<EVP_PKEY> key(PEM_read_bio_PrivateKey(pem, nullptr, &noPassphrase, nullptr));
    if (key && (EVP_PKEY_base_id(key.get()) != EVP_PKEY_RSA || EVP_PKEY_bits(key.get()) > kMaxKeyBits))
        key.reset();
    return key;
}

Result sign(const QByteArray& text, const QByteArray& privateKey, QByteArray& signature)
{
    const Owner<EVP_MD_CTX> context(EVP_MD_CTX_create());
    if (!context)
        return failure("Could not create context for OpenSSL digest.");
    const EVP_MD* digest = EVP_get_digestbyname("sha256");
    if (!digest)
        return failure("Could not find sha256 digest in OpenSSL.");
    const Owner<BIO> pem(BIO_new_mem_buf(privateKey.constData(), privateKey.size()));
    if (!pem)
        return failure("Could not create PEM buffer.");
    const Owner<EVP_PKEY> key = readRsaKey(pem.get());
    if (!key)
        return failure("Could not parse PEM to get private key.");
    if (EVP_DigestSignInit(context.get(), nullptr, digest, nullptr, key.get()) != 1)
        return failure("Could not initialize PEM digest.");
    if (EVP_DigestSignUpdate(context.get(), text.constData(), static_cast<std::size_t>(text.size())) != 1)
        return failure("Could not update PEM digest.");
    // The first call only tells how long the signature can become.
    std::size_t length = 0;
    if (EVP_DigestSignFinal(context.get(), nullptr, &length) != 1)
        return failure("Could not finalize PEM digest (1/2).");
    QByteArray bytes(static_cast<int>(length), '\0');
    if (EVP_DigestSignFinal(context.get(), reinterpret_cast<uchar*>(bytes.data()), &length) != 1)
        return failure("Could not finalize PEM digest (2/2).");
    bytes.truncate(static_cast<int>(length));
    signature = bytes;
    return {};
}

/// The alphabet for addresses and no padding, as tokens have it.
QByteArray encoded(const QByteArray& bytes)
{
    return bytes.toBase64(QByteArray::Base64UrlEncoding | QByteArray::OmitTrailingEquals);
}

QByteArray encoded(const QJsonObject& object)
{
    return encoded(QJsonDocument(object).toJson(QJsonDocument::Compact));
}

}  // namespace

Result signJsonWebToken(const QJsonObject& header, const QJsonObject& claims, const QByteArray& privateKey,
                        QByteArray& token)
{
    const QByteArray text = encoded(header) + '.' + encoded(claims);
    QByteArray signature;
    Result result = sign(text, privateKey, signature);
    if (result.good())
        token = text + '.' + encoded(signature);
    return result;
}

}  // namespace Kdd
