#include "server/access/AccessGate.h"

#include "server/Handled.h"
#include "server/access/TokenIssuer.h"

#include <gtest/gtest.h>

using namespace Kdd;
using namespace Kdd::Access;

namespace
{

/// What is let in, and with which headers.
class Inside : public Http::Handler
{
public:
    Http::Response answer(const Http::Request& request) override
    {
        QByteArray names;
        for (const Http::Field& field : request.headers)
            names += field.name + ' ';
        Http::Response response = Http::textResponse(200, "text/plain", names);
        response.addHeader("May", request.caller + ": " + request.rights.toList().join(' '));
        if (request.path.size() > 2)
            response.addHeader("Study", request.path[2]);
        if (request.method == Http::Method::Options && request.path.last() != "series")
            response.addHeader("Allow", request.path.last() == "studies" ? "GET, POST" : "GET");
        return response;
    }
};

class AccessGateTest : public testing::Test
{
protected:
    AccessGateTest()
    {
        mRequest.base = "https://pacs.example/images";
        mRequest.peer = "10.0.0.1";
        mRequest.isEncrypted = true;
        mRequest.path = {"dicom-web", "studies"};
    }

    Http::Response answer(const Headers& headers = {})
    {
        Inside inside;
        Http::Request request = mRequest;
        request.headers = headers;
        return AccessGate(mRules, RightsTable({"dicom-web"}), {"10.0.0.9"}, mLook, nullptr, inside)
            .answer(request);
    }
    int status(const Headers& headers = {}) { return answer(headers).status; }

    /// By the method and the path, for somebody of these rights.
    int statusFor(Rights rights, Http::Method method, const char* path)
    {
        mRules.anyone = rights;
        mRequest.method = method;
        mRequest.path = requestFor(path).path;
        return status();
    }

    void useHeader()
    {
        mRules.header = HeaderRules{"x-user", {"10.0.0.1"}, {{"*", Right::Read}, {"anna", Right::Store}}};
    }

    AccessRules mRules;
    AccessGate::Look mLook;
    Http::Request mRequest;
};

TEST_F(AccessGateTest, AsksForTheRightThatARequestTakes)
{
    constexpr auto kGet = Http::Method::Get;
    constexpr auto kPost = Http::Method::Post;
    constexpr auto kDelete = Http::Method::Delete;
    const std::tuple<Http::Method, const char*, Rights> kRequests[] = {
        {kGet, "dicom-web/studies", Right::Read},
        {Http::Method::Head, "dicom-web/studies", Right::Read},
        {Http::Method::Options, "dicom-web/studies", Right::Read},
        {kPost, "dicom-web/studies", Right::Store},
        {kPost, "dicom-web/studies/1.2", Right::Store},
        {kGet, "dicom-web/studies/1.2/corrections", Right::Read},
        {kPost, "dicom-web/studies/1.2/corrections", Right::Correct},
        {kDelete, "dicom-web/studies/1.2/series/1.3", Right::Delete},
        {kGet, "browser/studies/1.2/corrections", Right::Read},
        {kGet, "browser/config", Right::Read},
        {kGet, "wado", Right::Read},
    };
    for (const auto& [method, path, needs] : kRequests) {
        EXPECT_EQ(statusFor(needs, method, path), 200) << path;
        EXPECT_EQ(statusFor(kAllRights & ~needs, method, path), 403) << path;
        EXPECT_EQ(statusFor({}, method, path), 403) << path;
    }
    for (const char* path : {"", "page/app.js", "viewer/app.js"})
        EXPECT_EQ(statusFor({}, kGet, path), 200) << path;
}

TEST_F(AccessGateTest, RefusesWhatStandsInNoTable)
{
    for (const char* path : {"dicom-web", "dicom-web/made-up", "dicom-web/studies/1.2/made-up", "made-up",
                             "healthz", "dicom-web/studies/a b", "Browser/config"})
        EXPECT_EQ(statusFor(kAllRights, Http::Method::Get, path), 404) << path;
    for (const char* path : {"dicom-web/changefeed", "browser/config"})
        EXPECT_EQ(statusFor(kAllRights, Http::Method::Post, path), 405) << path;
    EXPECT_EQ(statusFor(kAllRights, Http::Method::Other, "dicom-web/studies"), 405);
    EXPECT_EQ(headerOf(answer(), "Allow"), "GET, POST") << "what the path has, and no other";
    EXPECT_EQ(statusFor(kAllRights, Http::Method::Other, "dicom-web/series"), 404);
    EXPECT_EQ(statusFor({}, Http::Method::Get, "dicom-web/made-up"), 403);
}

TEST_F(AccessGateTest, AsksForAStudyThatIsNotThereInPlaceOfAHiddenOne)
{
    const TokenIssuer issuer;
    const QTemporaryDir folder;
    mRules = issuer.rules(folder.path(),
                          R"("rights":[{"gives":["read"]}],"studies":[{"claim":"s","attribute":"StudyID"}])");
    const Http::Field token = {"authorization", "Bearer " + issuer.token(TokenIssuer::lastingClaims())};
    mRequest.path = {"dicom-web", "studies", "1.2", "metadata"};
    const std::tuple<DicomWeb::Sight, int, bool> kSights[] = {{DicomWeb::Sight::Seen, 200, true},
                                                              {DicomWeb::Sight::Hidden, 200, false},
                                                              {DicomWeb::Sight::Unknown, 503, false}};
    for (const auto& [shown, expected, isNamed] : kSights) {
        mLook = [sight = shown](const auto&, const QByteArray& study) {
            EXPECT_EQ(study, "1.2");
            return sight;
        };
        const Http::Response response = answer({token});
        EXPECT_EQ(response.status, expected);
        EXPECT_EQ(headerOf(response, "Study") == "1.2", isNamed);
    }
}

TEST_F(AccessGateTest, BelievesNamesOfNamedPeersOnly)
{
    useHeader();
    const Http::Response good = answer({{"x-user", "anna"}, {"accept", "*/*"}, {"cookie", "a"}});
    EXPECT_EQ(good.status, 200);
    EXPECT_EQ(good.caller, "anna");
    EXPECT_EQ(bodyOf(good), "accept ");
    EXPECT_EQ(headerOf(good, "Cache-Control"), "private");
    EXPECT_EQ(status({{"x-user", "anna"}, {"x-user", "eve"}}), 403);
    EXPECT_EQ(status({{"x-user", ""}}), 403);
    EXPECT_EQ(status(), 403);
    mRequest.peer = "10.0.0.2";
    EXPECT_EQ(status({{"x-user", "anna"}}), 403);
    // Nor does it get further in.
    mRules.anyone = Right::Read;
    const Http::Response anybody = answer({{"x-user", "anna"}});
    EXPECT_EQ(anybody.caller, "");
    EXPECT_EQ(bodyOf(anybody), "");
}

TEST_F(AccessGateTest, GivesUsersWhatTheirNamesDo)
{
    useHeader();
    mRequest.method = Http::Method::Post;
    EXPECT_EQ(headerOf(answer({{"x-user", "anna"}}), "May"), "anna: read store");
    EXPECT_EQ(status({{"x-user", "bert"}}), 403);
    EXPECT_EQ(status({{"x-user", "*"}}), 403);
    mRules.header.reset();
    mRules.certificates = CertificateRules{"ca.pem", {{"CN=scanner,O=A", Right::Store}}};
    EXPECT_EQ(status(), 403);
    mRequest.certificate = "CN=scanner,O=B";
    EXPECT_EQ(status(), 403);
    mRequest.certificate = "CN=scanner,O=A";
    EXPECT_EQ(status(), 200);
}

TEST_F(AccessGateTest, LetsPagesOfNamedOriginsReadAnswers)
{
    mRules.anyone = Right::Read;
    EXPECT_EQ(headerOf(answer({{"origin", "https://viewer.example"}}), "Vary"), "");
    mRules.origins.origins = {"https://viewer.example:443", "http://localhost:3000"};
    const Http::Response named = answer({{"origin", "https://viewer.example"}});
    EXPECT_EQ(headerOf(named, "Access-Control-Allow-Origin"), "https://viewer.example");
    EXPECT_TRUE(headerOf(named, "Access-Control-Expose-Headers").contains("Content-Location"));
    EXPECT_EQ(headerOf(named, "Vary"), "Origin");
    for (const char* origin :
         {"https://viewer.example.evil", "http://viewer.example", "null", "https://Viewer.example"}) {
        const Http::Response other = answer({{"origin", origin}});
        EXPECT_EQ(headerOf(other, "Access-Control-Allow-Origin"), "") << origin;
        EXPECT_EQ(headerOf(other, "Vary"), "Origin") << origin;
    }
    // Also of a refusal, which a page wants to show.
    mRules.anyone = {};
    EXPECT_EQ(headerOf(answer({{"origin", "http://localhost:3000"}}), "Access-Control-Allow-Origin"),
              "http://localhost:3000");
}

TEST_F(AccessGateTest, AnswersBrowsersThatAskBeforehandWithoutToken)
{
    mRules.origins.origins = {"https://viewer.example"};
    mRequest.method = Http::Method::Options;
    const Http::Field origin = {"origin", "https://viewer.example"};
    const Http::Field method = {"access-control-request-method", "GET"};
    const Http::Response asked =
        answer({origin, method, {"access-control-request-headers", "accept,authorization"}});
    EXPECT_EQ(asked.status, 204);
    EXPECT_EQ(headerOf(asked, "Access-Control-Allow-Origin"), "https://viewer.example");
    EXPECT_EQ(headerOf(asked, "Access-Control-Allow-Headers"),
              "Accept, Authorization, Content-Type, If-None-Match, Range");
    EXPECT_EQ(headerOf(asked, "Access-Control-Max-Age"), "7200");
    EXPECT_EQ(status({{"origin", "https://evil.example"}, method}), 403);
    EXPECT_EQ(status({origin}), 403);
    mRules.origins.origins.clear();
    EXPECT_EQ(status({origin, method}), 403);
}

TEST_F(AccessGateTest, LetsNoPageOfOtherOriginsChangeAnything)
{
    mRules.anyone = kAllRights;
    mRequest.method = Http::Method::Post;
    mRules.origins.origins = {"https://viewer.example"};
    for (const char* origin : {"https://pacs.example", "https://viewer.example"})
        EXPECT_EQ(status({{"origin", origin}}), 200) << origin;
    for (const char* origin :
         {"https://evil.example", "null", "", "http://pacs.example", "https://pacs.example:8443"})
        EXPECT_EQ(status({{"origin", origin}}), 403) << origin;
    for (const char* site : {"same-origin", "none"})
        EXPECT_EQ(status({{"sec-fetch-site", site}}), 200) << site;
    for (const char* site : {"cross-site", "same-site", ""})
        EXPECT_EQ(status({{"sec-fetch-site", site}}), 403) << site;
    EXPECT_EQ(status({{"sec-fetch-site", "cross-site"}, {"origin", "https://viewer.example"}}), 200);
    EXPECT_EQ(status(), 200) << "no browser";
}

TEST_F(AccessGateTest, TellsWhatIsWrongWithATokenAndNothingOfIt)
{
    const QTemporaryDir folder;
    const TokenIssuer issuer;
    mRules = issuer.rules(folder.path(), kReaders);
    const QByteArray good = "Bearer " + issuer.token(TokenIssuer::lastingClaims());
    const QByteArray invalid = R"(Bearer realm="kdd", error="invalid_token", error_description="The )";
    const std::tuple<Headers, int, QByteArray> kHeaders[] = {
        {{{"authorization", good}}, 200, ""},
        {{{"authorization", "bEARER" + good.mid(6)}}, 200, ""},
        {{}, 401, R"(Bearer realm="kdd")"},
        {{{"authorization", "Basic YTpi"}}, 401, R"(Bearer realm="kdd")"},
        {{{"authorization", "Bearer"}}, 401, R"(Bearer realm="kdd")"},
        {{{"authorization", "Bearer secret"}}, 401, invalid + "token cannot be read\""},
        {{{"authorization", good.chopped(4)}}, 401, invalid},
        {{{"authorization", good}, {"authorization", good}},
         400,
         R"(Bearer realm="kdd", error="invalid_request", error_description="There are several tokens")"},
    };
    for (const auto& [headers, expected, challenge] : kHeaders) {
        const Http::Response response = answer(headers);
        EXPECT_EQ(response.status, expected) << challenge.constData();
        EXPECT_TRUE(headerOf(response, "WWW-Authenticate").startsWith(challenge)) << challenge.constData();
    }
    mRequest.method = Http::Method::Post;
    const Http::Response noRight = answer({{"authorization", good}});
    EXPECT_EQ(noRight.status, 403);
    EXPECT_TRUE(headerOf(noRight, "WWW-Authenticate").contains("insufficient_scope"));
    EXPECT_EQ(noRight.caller, "anna");
    // A bad one is told also where nobody would need one.
    mRules.anyone = kAllRights;
    EXPECT_EQ(status({{"authorization", "Bearer secret"}}), 401);
    EXPECT_EQ(status({{"authorization", good}}), 200);
    mRequest.isEncrypted = false;
    EXPECT_EQ(status({{"authorization", good}}), 403);
    for (const char* peer : {"127.0.0.1", "::1", "10.0.0.9"}) {
        mRequest.peer = peer;
        EXPECT_EQ(status({{"authorization", good}}), 200) << peer;
    }
}

}  // namespace
