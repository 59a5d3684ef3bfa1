// What a provider tells of itself, and what browsers say to have been given. Nobody has shown yet who sends the one.

#include "fuzz/Property.h"
#include "server/access/SignIn.h"

using namespace Kdd;
using namespace Kdd::Access;

namespace
{

/// Nobody but us has the key.
SessionSeal seal()
{
    SessionSeal made;
    SessionSeal::parse(QByteArray(64, 'a'), made);
    return made;
}

SignIn& signIn()
{
    TokenRules tokens;
    tokens.issuer = QStringLiteral("i");
    tokens.keys = "/none";
    static SignIn made(tokens, SignInRules(), seal(), {}, [] { return std::chrono::seconds(1000); });
    return made;
}

bool isSent(const QByteArray& address)
{
    return (address.startsWith("https://") || address.startsWith("http://")) && !address.contains('\n') &&
           !address.contains('\r') && !address.contains('#') && !address.contains(' ');
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, std::size_t size)
{
    const QByteArray text = bytesOf(data, size);
    ProviderAddresses addresses;
    const bool isGood = ProviderAddresses::parse(text, QStringLiteral("i"), addresses).good();
    require(isGood == isSent(addresses.authorisation) && isGood == isSent(addresses.token),
            "browsers and codes go to addresses alone");
    require(addresses.endSession.isEmpty() || isSent(addresses.endSession), "and so they leave");
    QByteArray opened;
    for (const auto purpose : {SessionSeal::Purpose::Session, SessionSeal::Purpose::SigningIn})
        require(!seal().open(purpose, text, opened), "nobody seals without the key");
    const QByteArray sealed = seal().seal(SessionSeal::Purpose::Session, text);
    if (!sealed.isNull())
        require(seal().open(SessionSeal::Purpose::Session, sealed, opened) && opened == text,
                "what is sealed is opened again");
    Caller caller;
    Http::Request request;
    request.headers = {
        {"cookie", text}, {"cookie", "kdd-session=" + text}, {"cookie", "kdd-session=" + sealed}};
    if (signIn().identify(request, caller))
        require(!caller.subject.isEmpty() && caller.isByCookie, "somebody has a name");
    return 0;
}
