#include "server/access/AccessGate.h"

#include <algorithm>

namespace Kdd::Access
{
namespace
{

constexpr int kLongestName = 256;  // [bytes] of a user; it stands in every line of the audit trail
constexpr const char* kRealm = R"(Bearer realm="kdd")";

/// What to do about it stands in the header, for programs, and in the body, for people.
Http::Response badToken(int status, const char* error, const QByteArray& description)
{
    Http::Response response = Http::failure(status, QString::fromLatin1(description));
    response.addHeader("WWW-Authenticate", QByteArray(kRealm) + ", error=\"" + error +
                                               "\", error_description=\"" + description + '"');
    return response;
}

Http::Response unavailable()
{
    Http::Response response =
        Http::failure(503, QStringLiteral("The keys that tokens are signed with cannot be had now"));
    response.addHeader("Retry-After", "10");
    return response;
}

Http::Response notInTable(Asked::Verdict verdict)
{
    if (verdict == Asked::Verdict::Unknown)
        return Http::failure(404, QStringLiteral("Nothing has this path"));
    Http::Response response = Http::failure(405, QStringLiteral("This is not asked for by that method"));
    response.addHeader("Allow", "GET, HEAD, OPTIONS");
    return response;
}

int countOf(const Http::Request& request, const QByteArray& name)
{
    return static_cast<int>(std::count_if(request.headers.begin(), request.headers.end(),
                                          [&](const Http::Field& field) { return field.name == name; }));
}

Rights rightsOf(const NamedRights& named, const QByteArray& name)
{
    return named.value("*") | named.value(name);
}

bool isThisMachine(const QByteArray& peer)
{
    return peer.startsWith("127.") || peer == "::1";
}

bool hasHeader(const Http::Response& response, const char* name)
{
    return std::any_of(response.headers.begin(), response.headers.end(),
                       [&](const Http::Field& field) { return field.name == name; });
}

}  // namespace

AccessGate::AccessGate(const AccessRules& rules, RightsTable table, QVector<QByteArray> proxies,
                       Http::Handler& inner)
    : mRules(rules)
    , mTable(std::move(table))
    , mProxies(std::move(proxies))
    , mOrigins(rules.origins)
    , mTokens(rules.tokens ? std::make_unique<TokenCheck>(*rules.tokens) : nullptr)
    , mInner(inner)
{
}

AccessGate::~AccessGate() = default;

Http::Response AccessGate::answer(const Http::Request& request)
{
    Http::Response response = mOrigins.isPreflight(request) ? mOrigins.preflight(request) : admit(request);
    mOrigins.mark(request, response);
    return response;
}

Http::Response AccessGate::admit(const Http::Request& request)
{
    const Asked asked = mTable.find(request);
    if (asked.verdict == Asked::Verdict::Open)
        return mInner.answer(withoutSecrets(request));
    Caller caller = {{}, mRules.anyone};
    Http::Response refusal;
    if (!identify(request, caller, refusal))
        return refusal;
    Http::Response response = decide(request, asked, caller);
    response.caller = caller.subject;
    return response;
}

Http::Response AccessGate::decide(const Http::Request& request, const Asked& asked, const Caller& caller)
{
    const bool isNamed = !caller.subject.isEmpty();
    // Who may nothing is not told either what there is.
    if (!isNamed && !caller.rights)
        return stranger();
    if (asked.verdict != Asked::Verdict::Needs)
        return notInTable(asked.verdict);
    if (!caller.rights.testFlag(asked.right))
        return isNamed ? noRight() : stranger();
    if (asked.right != Right::Read && mOrigins.isForeign(request))
        return Http::failure(403, QStringLiteral("Pages of other origins may change nothing here"));
    Http::Request known = withoutSecrets(request);
    known.caller = caller.subject;
    for (const auto& each : kRightNames)
        if (caller.rights.testFlag(each.right))
            known.rights.append(each.name);
    Http::Response response = mInner.answer(known);
    // What one may see is not for those whom a proxy serves from its store.
    if (isNamed && !hasHeader(response, "Cache-Control"))
        response.addHeader("Cache-Control", "private");
    return response;
}

/// False with an answer for who says it badly; the caller stays as it was for who does not say it.
bool AccessGate::identify(const Http::Request& request, Caller& caller, Http::Response& refusal)
{
    if (mTokens != nullptr && !request.header("authorization").isNull())
        return identifyByToken(request, caller, refusal);
    if (mRules.header && mRules.header->peers.contains(request.peer)) {
        const QByteArray user = request.header(mRules.header->name.constData());
        // Of two the one in front may have looked at the other.
        if (countOf(request, mRules.header->name) == 1 && !user.isEmpty() && user.size() <= kLongestName) {
            caller = {user, mRules.anyone | rightsOf(mRules.header->users, user)};
            return true;
        }
    }
    if (mRules.certificates && !request.certificate.isEmpty())
        caller = {request.certificate,
                  mRules.anyone | rightsOf(mRules.certificates->subjects, request.certificate)};
    return true;
}

bool AccessGate::identifyByToken(const Http::Request& request, Caller& caller, Http::Response& refusal)
{
    constexpr const char* kScheme = "bearer ";
    const QByteArray said = request.header("authorization");
    const bool isSecret =
        request.isEncrypted || isThisMachine(request.peer) || mProxies.contains(request.peer);
    if (!isSecret)
        refusal = Http::failure(403, QStringLiteral("Tokens are taken over TLS only"));
    else if (countOf(request, "authorization") != 1)
        refusal = badToken(400, "invalid_request", "There are several tokens");
    else if (said.left(7).toLower() != kScheme)
        refusal = stranger();
    else {
        const TokenCheck::Verdict verdict = mTokens->check(said.mid(7).trimmed());
        caller = {verdict.caller.subject, verdict.caller.rights | mRules.anyone};
        if (verdict.fault.isEmpty() && !verdict.isUndecidable)
            return true;
        refusal = verdict.isUndecidable ? unavailable() : badToken(401, "invalid_token", verdict.fault);
    }
    return false;
}

/// For who does not say who he is, and has to.
Http::Response AccessGate::stranger() const
{
    if (mTokens == nullptr)
        return Http::failure(403, QStringLiteral("Who asks is not known, and nobody else may"));
    Http::Response response = Http::failure(401, QStringLiteral("This takes a token"));
    response.addHeader("WWW-Authenticate", kRealm);
    return response;
}

Http::Response AccessGate::noRight() const
{
    if (mTokens != nullptr)
        return badToken(403, "insufficient_scope", "You have no right to this");
    return Http::failure(403, QStringLiteral("You have no right to this"));
}

/// Nothing further in needs them, and what it does not have it cannot tell.
Http::Request AccessGate::withoutSecrets(const Http::Request& request) const
{
    Http::Request made = request;
    const auto isSecret = [this](const Http::Field& field) {
        return field.name == "authorization" || field.name == "cookie" ||
               (mRules.header && field.name == mRules.header->name);
    };
    made.headers.erase(std::remove_if(made.headers.begin(), made.headers.end(), isSecret),
                       made.headers.end());
    return made;
}

}  // namespace Kdd::Access
