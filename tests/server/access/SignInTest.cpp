#include "server/ServerFixture.h"
#include "server/access/TestProvider.h"
#include "support/FileContent.h"

#include <QDir>

using namespace Kdd;
using namespace Kdd::Access;

namespace
{

const QByteArray kOpened = "Sec-Fetch-Mode: navigate\r\n";

/// A server at which people sign in, and a browser.
class SignInTest : public ServerFixture
{
protected:
    SignInTest()
    {
        putFile(mStore.filePath("secret"), "a+b\n");
        useKeys(QByteArray(64, 'a'));
    }

    void useKeys(const QByteArray& keys) const
    {
        putFile(mStore.filePath("session"), keys);
        QFile::setPermissions(mStore.filePath("session"), QFile::ReadOwner | QFile::WriteOwner);
    }
    void start()
    {
        const QByteArray file =
            R"({"tokens":{"issuer":")" + mProvider.url() + R"(","audience":"archive","keys":")" +
            mProvider.url("/keys") +
            R"(","rights":[{"claim":"scope","value":"images.read","gives":["read","store"]}]},)" +
            R"("signIn":{"client":"kdd","sessionKeys":")" + mStore.filePath("session").toUtf8() +
            R"(","secretFile":")" + mStore.filePath("secret").toUtf8() + R"("},"audit":")" +
            mStore.filePath("audit.jsonl").toUtf8() + "\"}";
        ASSERT_EQ(AccessRules::parse(file, mSettings.access.emplace()).text(), QString());
        ServerFixture::start();
    }

    /// Keeps the cookies that the answer sets.
    Reply ask(const QByteArray& method, const QByteArray& path, const QByteArray& headers = {},
              const QByteArray& body = {})
    {
        QByteArray cookies;
        for (auto each = mCookies.begin(); each != mCookies.end(); ++each)
            cookies += (cookies.isEmpty() ? "Cookie: " : "; ") + each.key() + '=' + each.value();
        const Reply reply =
            ServerFixture::ask(method, path, headers + (cookies.isEmpty() ? "" : cookies + "\r\n"), body);
        for (const QByteArray& line : reply.head.split('\n')) {
            if (!line.startsWith("Set-Cookie: "))
                continue;
            const QByteArray pair = line.mid(12, line.indexOf(';') - 12);
            const QByteArray name = pair.left(pair.indexOf('='));
            if (line.contains("Max-Age=0"))
                mCookies.remove(name);
            else
                mCookies.insert(name, pair.mid(name.size() + 1));
        }
        return reply;
    }
    int status(const QByteArray& method, const QByteArray& path, const QByteArray& headers = {})
    {
        return ask(method, path, headers).status;
    }

    /// The path on this server that an address leads to, behind the origin.
    QByteArray pathOf(const QByteArray& address) const
    {
        return address.startsWith("http://localhost/") ? address.mid(16) : address;
    }
    QByteArray backFrom(const QByteArray& path = "/signin?to=/")
    {
        const Reply begun = ask("GET", path);
        EXPECT_EQ(begun.status, 303);
        return pathOf(mProvider.authorise(begun.header("Location")));
    }
    Reply signIn() { return ask("GET", backFrom()); }

    TestProvider mProvider;
    QMap<QByteArray, QByteArray> mCookies;
};

TEST_F(SignInTest, LeadsThroughTheProviderToWhereOneWanted)
{
    start();
    EXPECT_EQ(status("GET", "/browser/config"), 401);
    EXPECT_EQ(ask("GET", "/browser/config").header("X-Sign-In"), "http://localhost/signin");
    const Reply begun = ask("GET", "/viewer/view?a=b%20c&d", kOpened);
    EXPECT_EQ(begun.status, 303);
    EXPECT_TRUE(begun.header("Location").startsWith(mProvider.url("/authorise?a=b&response_type=code&")));
    EXPECT_EQ(begun.header("Cache-Control"), "no-store");
    EXPECT_EQ(begun.header("Referrer-Policy"), "no-referrer");
    const QByteArray back = mProvider.authorise(begun.header("Location"));
    EXPECT_EQ(mProvider.asked.value(QStringLiteral("client_id")), QStringLiteral("kdd"));
    EXPECT_EQ(mProvider.asked.value(QStringLiteral("scope")), QStringLiteral("openid profile"));
    const Reply in = ask("GET", pathOf(back));
    EXPECT_EQ(in.status, 303);
    EXPECT_EQ(in.header("Location"), "http://localhost/viewer/view?a=b%20c&d");
    EXPECT_EQ(mProvider.authorisation, "Basic " + QByteArray("kdd:a%2Bb").toBase64());
    EXPECT_TRUE(in.head.contains("; Path=/; HttpOnly; SameSite=Lax; Max-Age=28800\r\n"))
        << in.head.constData();
    EXPECT_EQ(mCookies.size(), 1);
    EXPECT_EQ(status("GET", "/browser/config"), 200);
    EXPECT_EQ(status("GET", "/browser/studies/1.2"), 404);
    EXPECT_EQ(status("GET", "/", kOpened), 200);
    // Another server, and one with a key in front of that one.
    useKeys(QByteArray(64, 'b') + '\n' + QByteArray(64, 'a'));
    start();
    EXPECT_EQ(status("GET", "/browser/config"), 200);
    useKeys(QByteArray(64, 'b'));
    start();
    EXPECT_EQ(status("GET", "/browser/config"), 401);
    mServer.reset();
    const QByteArray trail = fileContent(mStore.filePath("audit.jsonl"));
    EXPECT_TRUE(trail.contains(R"("resource":"signin","status":303,"subject":"anna")"));
    EXPECT_FALSE(trail.contains("code1") || trail.contains(mCookies.first()));
}

TEST_F(SignInTest, LetsNobodyInWithWhatIsNotHis)
{
    start();
    const std::pair<QString, QJsonValue> kClaims[] = {
        {QStringLiteral("nonce"), QStringLiteral("other")},
        {QStringLiteral("nonce"), QJsonValue()},
        {QStringLiteral("aud"), QStringLiteral("archive")},
        {QStringLiteral("aud"), QJsonArray{QStringLiteral("kdd"), QStringLiteral("other")}},
        {QStringLiteral("azp"), QStringLiteral("other")},
        {QStringLiteral("iss"), QStringLiteral("https://other.example")},
        {QStringLiteral("exp"), 1000},
        {QStringLiteral("sub"), QString()},
        {QStringLiteral("sub"), QString(300, QLatin1Char('a'))},
    };
    for (const auto& claim : kClaims) {
        mProvider.sign = [&](QJsonObject made) {
            made.insert(claim.first, claim.second);
            return mProvider.issuer.token(made);
        };
        EXPECT_EQ(signIn().status, 403) << claim.first.toStdString();
    }
    mProvider.sign = [](const QJsonObject& made) {
        return base64Url(R"({"alg":"none"})") + '.' + base64Url(TokenIssuer::text(made)) + '.';
    };
    EXPECT_EQ(signIn().status, 403);
    const TokenIssuer other;
    mProvider.sign = [&](const QJsonObject& made) { return other.token(made); };
    EXPECT_EQ(signIn().status, 403);
    mProvider.sign = nullptr;
    const std::tuple<const char*, const char*, int> kCallbacks[] = {
        {"state=", "state=x", 400},
        {"&state=", "&stat=", 400},
        {"?code=", "?code=x&code=", 400},
        {"?code=", "?iss=https://other.example&code=", 400},
        {"?code=", "?error=access_denied&c=", 403},
        {"?code=", "?code=x", 403},
    };
    for (const auto& [from, to, expected] : kCallbacks)
        EXPECT_EQ(status("GET", backFrom().replace(from, to)), expected) << to;
    const QByteArray back = backFrom();
    const QMap<QByteArray, QByteArray> begun = mCookies;
    mCookies.clear();
    EXPECT_EQ(status("GET", back), 400) << "another browser";
    mCookies.insert("kdd-session", begun.value("kdd-signin"));
    EXPECT_EQ(status("GET", "/browser/config"), 401) << "what is sealed for one thing is none for another";
    mCookies = begun;
    EXPECT_EQ(status("GET", back), 303);
    EXPECT_EQ(status("GET", back), 303) << "who is in is in";
    mCookies = begun;
    EXPECT_EQ(status("GET", back), 403) << "a code is good for one time";
    EXPECT_EQ(status("GET", "/browser/config"), 401);
}

TEST_F(SignInTest, LeadsNowhereElse)
{
    start();
    const std::pair<const char*, const char*> kPlaces[] = {
        {"/viewer/?a=b", "/viewer/?a=b"}, {"", "/"},
        {"https://evil.example/", "/"},   {"//evil.example/", "/"},
        {"/\\evil.example", "/"},         {"viewer", "/"},
        {"@evil.example/", "/"},          {"/a\r\nX: y", "/"},
        {"javascript:alert(1)", "/"},
    };
    for (const auto& [to, leads] : kPlaces) {
        mCookies.clear();
        const Reply in = ask("GET", backFrom("/signin?to=" + QByteArray(to).toPercentEncoding()));
        EXPECT_EQ(in.header("Location"), QByteArray("http://localhost") + leads) << to;
    }
    EXPECT_TRUE(ask("GET", backFrom("/signin?to=/" + QByteArray(3000, 'a')))
                    .header("Location")
                    .endsWith("localhost/"));
}

TEST_F(SignInTest, ChangesNothingForPagesOfOthers)
{
    takeObjects();
    start();
    signIn();
    const QByteArray sent = anImage("1.2.3.1").file();
    const std::pair<const char*, int> kOrigins[] = {
        {"", 403},
        {"Origin: https://evil.example\r\n", 403},
        {"Origin: null\r\n", 403},
        {"Origin: https://evil.example\r\nX-Requested-With: a\r\nSec-Fetch-Site: same-origin\r\n", 403},
        {"Sec-Fetch-Site: same-site\r\nX-Requested-With: a\r\n", 403},
        {"Sec-Fetch-Site: same-origin\r\n", 200},
        {"X-Requested-With: fetch\r\n", 200},
        {"Origin: http://localhost\r\n", 200},
    };
    for (const auto& [origin, expected] : kOrigins) {
        const QByteArray headers = QByteArray(origin) + "Content-Type: application/dicom\r\n";
        EXPECT_EQ(ask("POST", "/dicom-web/studies", headers, sent).status, expected) << origin;
        EXPECT_EQ(QDir(mStore.filePath("objects/1.2")).exists(), expected == 200) << origin;
        EXPECT_EQ(status("GET", "/browser/config", origin), 200) << origin;
    }
    EXPECT_TRUE(ask("GET", "/browser/config").body.contains(R"("may":["store"])"));
    EXPECT_EQ(status("POST", "/signout"), 403);
    EXPECT_EQ(status("GET", "/signout"), 405);
    EXPECT_EQ(mCookies.size(), 1);
    const Reply out = ask("POST", "/signout", "Origin: http://localhost\r\n");
    EXPECT_EQ(out.body, "{\"to\":\"" + mProvider.url("/end") +
                            "?client_id=kdd&post_logout_redirect_uri=http%3A%2F%2Flocalhost%2F\"}");
    EXPECT_EQ(mCookies.size(), 0);
    EXPECT_EQ(status("GET", "/browser/config"), 401);
}

TEST_F(SignInTest, WorksBehindTheAddressThatBrowsersKnow)
{
    mSettings.addresses.publicAddress = "https://pacs.example/archive";
    start();
    const QByteArray back = mProvider.authorise(ask("GET", "/viewer/", kOpened).header("Location"));
    EXPECT_TRUE(back.startsWith("https://pacs.example/archive/signin/callback?"));
    const Reply in = ask("GET", back.mid(28));
    EXPECT_EQ(in.header("Location"), "https://pacs.example/archive/viewer/");
    EXPECT_TRUE(in.head.contains("; Path=/archive/; HttpOnly; SameSite=Lax; Max-Age=28800; Secure\r\n"));
    EXPECT_EQ(status("POST", "/signout", "Origin: https://pacs.example\r\n"), 200);
}

TEST_F(SignInTest, TellsWhenTheProviderCannotBeAsked)
{
    start();
    mSettings.access->signIn->discovery = "http://127.0.0.1:1/none";
    ServerFixture::start();
    for (int i = 0; i < 2; ++i)
        EXPECT_EQ(status("GET", "/", kOpened), 503);
    EXPECT_EQ(status("GET", "/page/app.js"), 200);
    EXPECT_EQ(mLog.count("Nobody can sign in: http://127.0.0.1:1/none"), 1);
    mSettings.access->signIn->sessionKeys = mStore.filePath("none");
    EXPECT_NE(refusal().find("none"), std::string::npos);
}

}  // namespace
