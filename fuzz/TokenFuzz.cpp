// Tokens, and the keys that they are signed with. Nobody has shown yet who sends the one.

#include "fuzz/Property.h"
#include "server/access/Base64Url.h"
#include "server/access/SignedToken.h"
#include "server/access/TokenClaims.h"

using namespace Kdd;
using namespace Kdd::Access;

namespace
{

TokenRules rules()
{
    TokenRules made;
    made.issuer = QStringLiteral("i");
    made.audiences = {QStringLiteral("a")};
    made.rights = {{QStringLiteral("scope"), QStringLiteral("r"), Right::Read},
                   {QStringLiteral("a.b"), QStringLiteral("r"), Right::Store}};
    return made;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, std::size_t size)
{
    const QByteArray text = bytesOf(data, size);
    const std::chrono::seconds now(1000);
    SignedToken token;
    if (SignedToken::parse(text, token)) {
        require(text.startsWith(token.text + '.'), "what is signed is the token's own beginning");
        require(!token.signature.isEmpty(), "there is a signature");
        QByteArray again;
        require(decodeBase64Url(text.mid(token.text.size() + 1), again) && again == token.signature,
                "what stands behind it is the signature");
        std::chrono::seconds until{};
        Caller caller;
        if (faultOfClaims(token.claims, rules(), now, until).isEmpty())
            require(until > now, "a good token is good for a while");
        if (callerOfClaims(token.claims, rules(), caller))
            require(!caller.subject.isEmpty(), "somebody has a name");
    }
    QByteArray bytes;
    if (decodeBase64Url(text, bytes))
        require(bytes.toBase64(QByteArray::Base64UrlEncoding | QByteArray::OmitTrailingEquals) == text,
                "no two texts stand for the same bytes");
    Result result;
    const std::shared_ptr<const TokenKeys> keys = TokenKeys::read(text, result);
    require((keys == nullptr) == result.bad(), "no keys have a reason");
    return 0;
}
