#pragma once

#include <QByteArray>
#include <QVector>

#include <kddlib/Result.h>

#include <memory>

struct evp_pkey_st;

namespace Kdd::Access
{

/// How a token is signed. Each takes keys of one type only, so that none can be taken for another's.
enum class Algorithm { RS256, ES256 };

/// The public keys of whoever signs tokens. Nothing of them changes once they are read, so any thread may use them.
class TokenKeys
{
public:
    /// The text of a key set (JWKS). Keys that are for something else, of other types or too weak are left out. Null, with
    /// the reason, when it is no key set or no key is left.
    static std::shared_ptr<const TokenKeys> read(const QByteArray& text, Result& result);

    /// Whether a key of that name signs so; without a name the only key that does.
    bool has(const QByteArray& id, Algorithm algorithm) const { return find(id, algorithm) != nullptr; }

    /// Whether the signature, as tokens have it, is that of the text by that key.
    bool verify(const QByteArray& id, Algorithm algorithm, const QByteArray& text,
                const QByteArray& signature) const;

private:
    struct Key
    {
        QByteArray id;
        Algorithm algorithm;
        std::shared_ptr<evp_pkey_st> key;
    };

    const Key* find(const QByteArray& id, Algorithm algorithm) const;

    QVector<Key> mKeys;
};

}  // namespace Kdd::Access
