#include "server/access/AccessGate.h"

#include <QUuid>

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

Http::Response notThere()
{
    return Http::failure(404, QStringLiteral("Nothing has this path"));
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

QByteArray headerOf(const Http::Response& response, const char* name)
{
    for (const Http::Field& field : response.headers)
        if (field.name == name)
            return field.value;
    return {};
}

}  // namespace

AccessGate::AccessGate(const AccessRules& rules, RightsTable table, QVector<QByteArray> proxies, Look look,
                       std::unique_ptr<SignIn> signIn, Http::Handler& inner)
    : mRules(rules)
    , mTable(std::move(table))
    , mProxies(std::move(proxies))
    , mOrigins(rules.origins)
    , mTokens(rules.tokens ? std::make_unique<TokenCheck>(*rules.tokens) : nullptr)
    , mSignIn(std::move(signIn))
    , mLook(std::move(look))
    , mNoStudy("none-" + QUuid::createUuid().toByteArray(QUuid::Id128))
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
    if (mSignIn != nullptr && SignIn::owns(request))
        return signInOrOut(request);
    if (hasToSignIn(request, asked))
        return mSignIn->begin(request, request.target);
    if (asked.verdict == Asked::Verdict::Open)
        return mInner.answer(withoutSecrets(request));
    Caller caller;
    caller.rights = mRules.anyone;
    Http::Response refusal;
    if (!identify(request, caller, refusal))
        return refusal;
    Http::Response response = decide(request, asked, caller);
    response.caller = caller.subject;
    return response;
}

Http::Response AccessGate::signInOrOut(const Http::Request& request)
{
    Caller caller;
    const bool changes = request.method == Http::Method::Post;
    if (!isSecret(request))
        return Http::failure(403, QStringLiteral("One signs in over TLS only"));
    if (changes && !Origins::isOwn(request))
        return Http::failure(403, QStringLiteral("Pages of other origins may change nothing here"));
    // After it nobody knows any more who that was.
    if (changes)
        mSignIn->identify(request, caller);
    Http::Response response = mSignIn->answer(request);
    if (response.caller.isEmpty())
        response.caller = caller.subject;
    return response;
}

/// Who opens a page with his browser, and is not known by anything, may as well say at once who he is.
bool AccessGate::hasToSignIn(const Http::Request& request, const Asked& asked)
{
    const bool isPage = asked.verdict == Asked::Verdict::Open && request.method == Http::Method::Get &&
                        (request.path.isEmpty() || request.path.first() == "viewer");
    const QByteArray mode = request.header("sec-fetch-mode");
    const bool isOpened = mode.isNull() ? request.header("accept").contains("text/html") : mode == "navigate";
    Caller caller;
    Http::Response refusal;
    return mSignIn != nullptr && isPage && isOpened && isSecret(request) && !mRules.anyone &&
           request.header("authorization").isNull() && identify(request, caller, refusal) &&
           caller.subject.isEmpty();
}

Http::Response AccessGate::decide(const Http::Request& request, const Asked& asked, const Caller& caller)
{
    const bool isNamed = !caller.subject.isEmpty();
    // Who may nothing is not told either what there is.
    if (!isNamed && !caller.rights)
        return stranger(request);
    if (asked.verdict == Asked::Verdict::Unknown)
        return notThere();
    if (asked.verdict == Asked::Verdict::NotSo)
        return otherMethod(request);
    if (!caller.rights.testFlag(asked.right))
        return isNamed ? noRight() : stranger(request);
    const bool isFromElsewhere = caller.isByCookie ? !Origins::isOwn(request) : mOrigins.isForeign(request);
    if (asked.right != Right::Read && isFromElsewhere)
        return Http::failure(403, QStringLiteral("Pages of other origins may change nothing here"));
    Http::Response response = passOn(request, asked, caller);
    // What one may see is not for those whom a proxy serves from its store.
    if (isNamed && headerOf(response, "Cache-Control").isEmpty())
        response.addHeader("Cache-Control", "private");
    return response;
}

/// Whether nobody reads it on its way.
bool AccessGate::isSecret(const Http::Request& request) const
{
    return request.isEncrypted || isThisMachine(request.peer) || mProxies.contains(request.peer);
}

/// The one place that keeps studies from those who may not see them: whatever is said of one study is said of another, that
/// does not exist. So nothing tells the two apart, and no resource has to think of it.
Http::Response AccessGate::passOn(const Http::Request& request, const Asked& asked, const Caller& caller)
{
    Http::Request known = withoutSecrets(request);
    known.studies = caller.studies;
    known.caller = caller.subject;
    for (const auto& each : kRightNames)
        if (caller.rights.testFlag(each.right))
            known.rights.append(each.name);
    if (caller.studies == nullptr || asked.reach != Asked::Reach::OneStudy)
        return mInner.answer(known);
    const DicomWeb::Sight sight =
        asked.study.isEmpty() ? DicomWeb::Sight::Hidden : mLook(caller.studies, asked.study);
    if (sight == DicomWeb::Sight::Unknown)
        return Http::failure(503, QStringLiteral("The image database cannot be asked now"));
    if (sight == DicomWeb::Sight::Hidden)
        known = mTable.withStudy(known, mNoStudy);
    // What names its study in a place that is not known here is for those alone who may see all.
    const bool isKnown = sight == DicomWeb::Sight::Seen || mTable.find(known).study == mNoStudy;
    return isKnown ? mInner.answer(known) : notThere();
}

/// Who answers for the path knows by which methods.
Http::Response AccessGate::otherMethod(const Http::Request& request)
{
    Http::Request known = withoutSecrets(request);
    known.method = Http::Method::Options;
    const QByteArray allowed = headerOf(mInner.answer(known), "Allow");
    if (allowed.isEmpty())
        return notThere();
    Http::Response response = Http::failure(405, QStringLiteral("This is not asked for by that method"));
    response.addHeader("Allow", allowed);
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
            caller.subject = user;
            caller.rights = mRules.anyone | rightsOf(mRules.header->users, user);
            return true;
        }
    }
    if (mSignIn != nullptr && isSecret(request) && mSignIn->identify(request, caller)) {
        caller.rights |= mRules.anyone;
    } else if (mRules.certificates && !request.certificate.isEmpty()) {
        caller.subject = request.certificate;
        caller.rights = mRules.anyone | rightsOf(mRules.certificates->subjects, request.certificate);
    }
    return true;
}

bool AccessGate::identifyByToken(const Http::Request& request, Caller& caller, Http::Response& refusal)
{
    constexpr const char* kScheme = "bearer ";
    const QByteArray said = request.header("authorization");
    if (!isSecret(request))
        refusal = Http::failure(403, QStringLiteral("Tokens are taken over TLS only"));
    else if (countOf(request, "authorization") != 1)
        refusal = badToken(400, "invalid_request", "There are several tokens");
    else if (said.left(7).toLower() != kScheme)
        refusal = stranger(request);
    else {
        const TokenCheck::Verdict verdict = mTokens->check(said.mid(7).trimmed());
        caller = verdict.caller;
        caller.rights |= mRules.anyone;
        if (verdict.fault.isEmpty() && !verdict.isUndecidable)
            return true;
        refusal = verdict.isUndecidable ? unavailable() : badToken(401, "invalid_token", verdict.fault);
    }
    return false;
}

/// For who does not say who he is, and has to.
Http::Response AccessGate::stranger(const Http::Request& request) const
{
    if (mTokens == nullptr)
        return Http::failure(403, QStringLiteral("Who asks is not known, and nobody else may"));
    Http::Response response = Http::failure(401, QStringLiteral("This takes a token"));
    response.addHeader("WWW-Authenticate", kRealm);
    // For the page, whose session has ended.
    if (mSignIn != nullptr)
        response.addHeader("X-Sign-In", request.base + "/signin");
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
