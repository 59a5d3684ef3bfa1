#include "server/access/AddressGuard.h"

#include "server/Handled.h"

using namespace Kdd;
using Access::AddressRules;

namespace
{

class BaseAsText : public Http::Handler
{
public:
    Http::Response answer(const Http::Request& request) override
    {
        return Http::textResponse(200, "text/plain", request.base);
    }
};

/// The base that a handler is told, or the status of who is not let through.
std::string baseFor(const AddressRules& rules, const QByteArray& base, const QByteArray& peer = "127.0.0.1",
                    const Headers& headers = {})
{
    AddressRules normal = rules;
    EXPECT_EQ(normal.normalise().text(), QString());
    BaseAsText inner;
    Http::Request request = requestFor("/", headers);
    request.base = base;
    request.peer = peer;
    const Http::Response response = Access::AddressGuard(normal, inner).answer(request);
    return response.status == 200 ? bodyOf(response).toStdString() : std::to_string(response.status);
}

TEST(AddressGuard, LetsOnlyThoseThroughWhoNameThisServer)
{
    const AddressRules rules = {"https://Images.example.org:8443/archive/", {"pacs", "192.168.1.2:80"}, {}};
    for (const char* host :
         {"localhost", "LOCALHOST:8042", "127.0.0.1", "127.0.0.1:8042", "[::1]", "[0:0::1]:80",
          "images.example.org", "images.example.org:1", "pacs", "192.168.1.2"})
        EXPECT_EQ(baseFor(rules, QByteArray("http://") + host), "https://Images.example.org:8443/archive")
            << host;
    for (const char* host :
         {"", "evil.example", "localhost.evil.example", "127.0.0.1.evil.example", "evil.example:127",
          "127.0.0.2", "localhost:evil", "localhost:80:80", "user@localhost", "[::1", "[::1]evil", "[evil]",
          "pacs.", "localhost evil", "192.168.1.2.3"})
        EXPECT_EQ(baseFor(rules, QByteArray("http://") + host), "421") << host;
}

TEST(AddressGuard, BelievesOnlyNamedProxies)
{
    const Headers kForwarded = {{"x-forwarded-proto", "https"},
                                {"x-forwarded-host", "far.example, pacs.example:8443"},
                                {"x-forwarded-prefix", "/a/b/"}};
    const AddressRules rules = {{}, {}, {"127.0.0.1", "0:0::1"}};
    EXPECT_EQ(baseFor(rules, "http://localhost:80", "127.0.0.1", kForwarded),
              "https://pacs.example:8443/a/b");
    EXPECT_EQ(baseFor(rules, "http://localhost:80", "::1", kForwarded), "https://pacs.example:8443/a/b");
    EXPECT_EQ(baseFor(rules, "http://localhost:80", "127.0.0.2", kForwarded), "http://localhost:80");
    EXPECT_EQ(baseFor({}, "http://localhost:80", "127.0.0.1", kForwarded), "http://localhost:80");
    EXPECT_EQ(baseFor({"https://public", {}, {"127.0.0.1"}}, "http://localhost", "127.0.0.1", kForwarded),
              "https://public");
}

TEST(AddressGuard, TakesOfAProxyOnlyWhatCanBeAnAddress)
{
    const std::pair<Http::Field, const char*> kHeaders[] = {
        {{"forwarded", "for=1.2.3.4;proto=https;host=\"pacs.example:1\""}, "https://pacs.example:1"},
        {{"forwarded", "host=far.example;proto=ftp, Proto=HTTPS;Host=pacs.example"}, "https://pacs.example"},
        {{"forwarded", "for=\"[::1]:80\""}, "http://localhost:80"},
        {{"forwarded", "host=\"evil example\"; proto=javascript"}, "http://localhost:80"},
        {{"x-forwarded-host", "evil/path"}, "http://localhost:80"},
        {{"x-forwarded-host", "a\"><script>"}, "http://localhost:80"},
        {{"x-forwarded-prefix", "no-slash"}, "http://localhost:80"},
        {{"x-forwarded-prefix", "//evil.example"}, "http://localhost:80"},
        {{"x-forwarded-prefix", "/a/../b"}, "http://localhost:80"},
        {{"x-forwarded-prefix", "/a?b"}, "http://localhost:80"},
        {{"x-forwarded-prefix", "/"}, "http://localhost:80"},
    };
    for (const auto& [header, base] : kHeaders)
        EXPECT_EQ(baseFor({{}, {}, {"127.0.0.1"}}, "http://localhost:80", "127.0.0.1", {header}), base)
            << header.value.constData();
}

TEST(AddressRules, NameTheValueThatTheyCannotFollow)
{
    const std::pair<AddressRules, const char*> kRules[] = {
        {{"images.example.org", {}, {}}, "images.example.org"},
        {{"ftp://images.example.org", {}, {}}, "ftp://images.example.org"},
        {{"https://", {}, {}}, "https:"},
        {{"https://a/b?c", {}, {}}, "https://a/b?c"},
        {{"https://a b", {}, {}}, "https://a b"},
        {{{}, {"a/b"}, {}}, "a/b"},
        {{{}, {}, {"proxy.example"}}, "proxy.example"},
        {{{}, {}, {"10.0.0.0/8"}}, "10.0.0.0/8"},
    };
    for (const auto& [given, named] : kRules) {
        AddressRules rules = given;
        EXPECT_TRUE(rules.normalise().text().contains(QLatin1String(named))) << named;
    }
}

}  // namespace
