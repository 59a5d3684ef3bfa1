#include "server/access/SessionSeal.h"

#include "server/access/Base64Url.h"

#include <QFile>
#include <QList>

#include <openssl/err.h>
#include <openssl/evp.h>
#include <openssl/rand.h>

#include <algorithm>
#include <memory>

namespace Kdd::Access
{
namespace
{

constexpr int kKeySize = 32;    // [bytes]
constexpr int kNonceSize = 12;  // of AES-GCM; drawn anew for each text
constexpr int kTagSize = 16;
constexpr int kMostKeys = 10;
constexpr int kLongestFile = 64 * 1024;

/// Browsers keep 4096 bytes of a cookie, with its name and attributes.
constexpr int kLongestSealed = 3700;

constexpr auto kForm = QByteArray::Base64UrlEncoding | QByteArray::OmitTrailingEquals;

using Context = std::unique_ptr<EVP_CIPHER_CTX, void (*)(EVP_CIPHER_CTX*)>;

Context newContext()
{
    return {EVP_CIPHER_CTX_new(), EVP_CIPHER_CTX_free};
}

const uchar* bytesOf(const QByteArray& bytes)
{
    return reinterpret_cast<const uchar*>(bytes.constData());
}

uchar* roomOf(QByteArray& bytes)
{
    return reinterpret_cast<uchar*>(bytes.data());
}

QByteArray nameOf(SessionSeal::Purpose purpose)
{
    return purpose == SessionSeal::Purpose::Session ? "kdd session 1" : "kdd signing in 1";
}

bool encrypt(const QByteArray& key, const QByteArray& nonce, const QByteArray& name, const QByteArray& text,
             QByteArray& made)
{
    const Context context = newContext();
    QByteArray tag(kTagSize, '\0');
    int size = 0;
    made.resize(text.size());
    const bool isDone =
        context != nullptr &&
        EVP_EncryptInit_ex(context.get(), EVP_aes_256_gcm(), nullptr, bytesOf(key), bytesOf(nonce)) == 1 &&
        EVP_EncryptUpdate(context.get(), nullptr, &size, bytesOf(name), name.size()) == 1 &&
        EVP_EncryptUpdate(context.get(), roomOf(made), &size, bytesOf(text), text.size()) == 1 &&
        EVP_EncryptFinal_ex(context.get(), roomOf(tag), &size) == 1 &&
        EVP_CIPHER_CTX_ctrl(context.get(), EVP_CTRL_GCM_GET_TAG, kTagSize, roomOf(tag)) == 1;
    made += tag;
    return isDone;
}

bool decrypt(const QByteArray& key, const QByteArray& bytes, const QByteArray& name, QByteArray& text)
{
    const Context context = newContext();
    QByteArray tag = bytes.right(kTagSize);
    const QByteArray body = bytes.mid(kNonceSize, bytes.size() - kNonceSize - kTagSize);
    QByteArray made(body.size(), '\0');
    int size = 0;
    const bool isGood =
        context != nullptr &&
        EVP_DecryptInit_ex(context.get(), EVP_aes_256_gcm(), nullptr, bytesOf(key), bytesOf(bytes)) == 1 &&
        EVP_CIPHER_CTX_ctrl(context.get(), EVP_CTRL_GCM_SET_TAG, kTagSize, tag.data()) == 1 &&
        EVP_DecryptUpdate(context.get(), nullptr, &size, bytesOf(name), name.size()) == 1 &&
        EVP_DecryptUpdate(context.get(), roomOf(made), &size, bytesOf(body), body.size()) == 1 &&
        EVP_DecryptFinal_ex(context.get(), roomOf(tag), &size) == 1;
    ERR_clear_error();
    if (isGood)
        text = made;
    return isGood;
}

}  // namespace

Result SessionSeal::parse(const QByteArray& text, SessionSeal& seal)
{
    SessionSeal made;
    for (const QByteArray& line : text.split('\n')) {
        const QByteArray digits = line.trimmed();
        if (digits.isEmpty() || digits.startsWith('#'))
            continue;
        const QByteArray key = QByteArray::fromHex(digits);
        if (key.toHex() != digits.toLower() || key.size() != kKeySize)
            return Result::failure(QStringLiteral("it has a line that is no key: 64 hexadecimal digits, as "
                                                  "\"openssl rand -hex 32\" makes them"));
        made.mKeys.append(key);
    }
    if (made.mKeys.isEmpty() || made.mKeys.size() > kMostKeys)
        return Result::failure(QStringLiteral("it needs 1 to %1 keys").arg(kMostKeys));
    seal = made;
    return {};
}

Result SessionSeal::read(const QString& path, SessionSeal& seal)
{
    QFile file(path);
    if (!file.open(QIODevice::ReadOnly))
        return Result::failure(file.errorString()).within(path);
    if ((file.permissions() & (QFileDevice::ReadOther | QFileDevice::WriteOther)) != 0)
        return Result::failure(
                   QStringLiteral("everybody may read these keys, and could be anybody with them"))
            .within(path);
    return parse(file.read(kLongestFile), seal).within(path);
}

QByteArray SessionSeal::seal(Purpose purpose, const QByteArray& text) const
{
    QByteArray nonce(kNonceSize, '\0');
    QByteArray made;
    if (mKeys.isEmpty() || text.size() > kLongestSealed || RAND_bytes(roomOf(nonce), kNonceSize) != 1 ||
        !encrypt(mKeys.first(), nonce, nameOf(purpose), text, made))
        return {};
    const QByteArray sealed = (nonce + made).toBase64(kForm);
    return sealed.size() > kLongestSealed ? QByteArray() : sealed;
}

bool SessionSeal::open(Purpose purpose, const QByteArray& sealed, QByteArray& text) const
{
    QByteArray bytes;
    if (sealed.size() > kLongestSealed || !decodeBase64Url(sealed, bytes) ||
        bytes.size() < kNonceSize + kTagSize)
        return false;
    return std::any_of(mKeys.begin(), mKeys.end(),
                       [&](const QByteArray& key) { return decrypt(key, bytes, nameOf(purpose), text); });
}

}  // namespace Kdd::Access
