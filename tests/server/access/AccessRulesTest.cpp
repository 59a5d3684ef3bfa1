#include "server/access/AccessRules.h"

#include "support/FileContent.h"

#include <QTemporaryDir>

#include <gtest/gtest.h>

using namespace Kdd;
using namespace Kdd::Access;

namespace
{

constexpr const char* kTokens = R"("issuer":"i","audience":"a","keys":"k","rights":[{"gives":["read"]}])";

TEST(AccessRules, SayWhoMayWhat)
{
    AccessRules rules;
    const Result result = AccessRules::parse(R"({
        "tokens": {"issuer": "https://login", "audience": ["a", "b"], "keys": "/k.json", "leeway": 5, "keysAge": 60,
                   "rights": [{"claim": "scope", "value": "x", "gives": ["read", "store"]}]},
        "header": {"name": "X-User", "peers": ["127.0.0.1", "0::1"], "users": {"*": ["read"], "anna": ["correct"]}},
        "certificates": {"caFile": "/ca.pem", "subjects": {"CN=scanner": ["store"]}},
        "cors": {"origins": ["https://Viewer.example:8443"]},
        "audit": "log"})",
                                             rules);
    ASSERT_EQ(result.text(), QString());
    EXPECT_FALSE(rules.anyone);
    EXPECT_EQ(rules.tokens->audiences.size(), 2);
    EXPECT_EQ(rules.tokens->leeway.count() + rules.tokens->keysAge.count() + rules.tokens->keysKept.count(),
              5 + 60 + 86400);
    EXPECT_EQ(rules.tokens->rights.at(0).gives, Rights(Right::Read) | Right::Store);
    EXPECT_EQ(rules.header->name, "x-user");
    EXPECT_EQ(rules.header->peers.at(1), "::1");
    EXPECT_EQ(rules.header->users.value("anna"), Rights(Right::Correct));
    EXPECT_EQ(rules.certificates->subjects.value("CN=scanner"), Rights(Right::Store));
    EXPECT_EQ(rules.origins.origins.at(0), "https://viewer.example:8443");
    EXPECT_EQ(rules.audit, "log");
}

TEST(AccessRules, OpenNoDoorByASlip)
{
    const QByteArray tokens = QByteArray(R"({"tokens":{)") + kTokens;
    const std::pair<QByteArray, const char*> kFiles[] = {
        {"", "no JSON object"},
        {"[]", "no JSON object"},
        {R"({"anyone":[],"anyone":["read"]})", "says something twice"},
        {R"({"anyone":[],"\u0061nyone":["read"]})", "says something twice"},
        {"{}", "it lets nobody in"},
        {R"({"anyone":[]})", "it lets nobody in"},
        {R"({"anyone":["reed"]})", "anyone has a right that is none"},
        {R"({"anyone":"read"})", "anyone is no list of rights"},
        {R"({"Anyone":["read"]})", "Anyone is nothing that stands there"},
        {tokens + R"(,"leaway":5}})", "tokens.leaway is nothing that stands there"},
        {tokens + R"(,"leeway":-1}})", "tokens.leeway is no number of seconds"},
        {tokens + R"(,"leeway":"60"}})", "tokens.leeway is no number of seconds"},
        {tokens + R"(,"keysAge":3600,"keysKept":60}})", "tokens.keysKept is less than keysAge"},
        {R"({"tokens":{"issuer":"i","audience":[],"keys":"k"}})", "tokens.audience is empty"},
        {R"({"tokens":{"issuer":"i","audience":["a",""],"keys":"k"}})", "tokens.audience has something"},
        {R"({"tokens":{"issuer":"","audience":"a","keys":"k"}})", "tokens.issuer is no text"},
        {R"({"tokens":{"issuer":"i","audience":"a"}})", "tokens.keys is no text"},
        {R"({"tokens":{"issuer":"i","audience":"a","keys":"k"}})", "tokens.rights is no list"},
        {R"({"tokens":{"issuer":"i","audience":"a","keys":"k","rights":[{"claim":"c","gives":["read"]}]}})",
         "tokens.rights.value is no text"},
        {R"({"tokens":{"issuer":"i","audience":"a","keys":"k","rights":[{"give":["read"]}]}})",
         "tokens.rights.gives is no list of rights"},
        {R"({"tokens":[]})", "tokens is no object"},
        {R"({"header":{"name":"X User","peers":["::1"],"users":{"*":["read"]}}})", "header.name is no name"},
        {R"({"header":{"name":"X-User","peers":["proxy"],"users":{"*":["read"]}}})",
         "header.peers has something"},
        {R"({"header":{"name":"X-User","peers":["::1"],"users":{}}})", "header.users names nobody"},
        {R"({"certificates":{"subjects":{"*":["read"]}}})", "certificates.caFile is no text"},
        {R"({"anyone":["read"],"cors":{"origins":["*"]}})", "cors.origins has something that is no origin"},
        {R"({"anyone":["read"],"cors":{"origins":["null"]}})",
         "cors.origins has something that is no origin"},
        {R"({"anyone":["read"],"cors":{"origins":["https://a/b"]}})", "cors.origins has something"},
        {R"({"anyone":["read"],"signIn":{"client":"c","sessionKeys":"k"}})", "signIn needs tokens"},
        {tokens + R"(},"signIn":{"sessionKeys":"k"}})", "signIn.client is no text"},
        {tokens + R"(},"signIn":{"client":"c"}})", "signIn.sessionKeys is no text"},
        {tokens + R"(},"signIn":{"client":"c","sessionKeys":"k","scope":"profile"}})", "signIn.scope lacks"},
        {tokens + R"(},"signIn":{"client":"c","sessionKeys":"k","session":5}})",
         "signIn.session is no number"},
        {R"({"anyone":["read"],"syslog":{"to":"tcp://a"}})", "syslog.to is no receiver"},
        {R"({"anyone":["read"],"syslog":{"to":"tls://a/b"}})", "syslog.to is no receiver"},
        {R"({"anyone":["read"],"syslog":{"to":"unix:log"}})", "syslog.to is no receiver"},
    };
    for (const auto& [text, reason] : kFiles) {
        AccessRules rules;
        const Result result = AccessRules::parse(text, rules);
        EXPECT_NE(result.text().toStdString().find(reason), std::string::npos)
            << text.toStdString() << ": " << result.text().toStdString();
        EXPECT_FALSE(rules.anyone || rules.tokens || rules.header || rules.certificates);
    }
}

TEST(AccessRules, SayWhereMessagesGoAndPeopleSignIn)
{
    AccessRules rules;
    const QByteArray begin =
        QByteArray(R"({"tokens":{)") + kTokens + R"(},"signIn":{"client":"c","sessionKeys":"k"},)";
    const std::tuple<const char*, SyslogRules::By, const char*, const char*> kReceivers[] = {
        {"tls://Audit.example", SyslogRules::By::Tls, "audit.example", "6514"},
        {"tls://audit.example:1234", SyslogRules::By::Tls, "audit.example", "1234"},
        {"udp://[::1]", SyslogRules::By::Udp, "::1", "514"},
        {"udp://[0::1]:99", SyslogRules::By::Udp, "::1", "99"},
        {"unix:/dev/log", SyslogRules::By::Socket, "/dev/log", ""},
    };
    for (const auto& [to, by, host, port] : kReceivers) {
        ASSERT_EQ(AccessRules::parse(begin + R"("syslog":{"to":")" + to + "\"}}", rules).text(), QString());
        EXPECT_EQ(rules.syslog->by, by) << to;
        EXPECT_EQ(rules.syslog->host, host) << to;
        EXPECT_EQ(rules.syslog->port, port) << to;
    }
    EXPECT_TRUE(rules.signIn->discovery.endsWith("/.well-known/openid-configuration"));
}

TEST(AccessRules, NameTheFileThatIsNotThere)
{
    AccessRules rules;
    const QTemporaryDir folder;
    const QString path = folder.filePath(QStringLiteral("access.json"));
    EXPECT_TRUE(AccessRules::read(path, rules).text().startsWith(path));
    const QByteArray text = R"({"anyone":["read"]})";
    putFile(path, text.leftJustified(1024 * 1024, ' '));
    EXPECT_TRUE(AccessRules::read(path, rules).good());
    putFile(path, text.leftJustified(1024 * 1024 + 1, ' '));
    EXPECT_TRUE(AccessRules::read(path, rules).text().contains(QLatin1String("too large")));
}

}  // namespace
