#include "server/ServerFixture.h"
#include "server/access/TokenIssuer.h"

#include <kddlib/TagFile.h>
#include <kddlib/TagMap.h>

using namespace Kdd;
using namespace Kdd::Access;

namespace
{

/// A server over a store of one study.
class ServedAccess : public ServerFixture
{
protected:
    ServedAccess()
    {
        TagFile file;
        file.addTagMap(anImage("1.2.3.1").map(), nullptr, true);
        EXPECT_TRUE(file.writeCacheFile());
    }

    void useTokens(const TokenIssuer& issuer)
    {
        mSettings.access = issuer.rules(mStore.folder(), kReaders);
        mSettings.access->audit = mStore.filePath("audit.jsonl").toUtf8();
    }

    void useTls()
    {
        mSettings.http.certificateFile = mTls.certificate();
        mSettings.http.keyFile = mTls.key();
    }

    TlsFiles mTls;
};

TEST_F(ServedAccess, ShowsNothingToABadToken)
{
    const TokenIssuer issuer;
    const TokenIssuer other;
    useTokens(issuer);
    start();
    const QJsonObject claims = TokenIssuer::lastingClaims();
    const QByteArray body = TokenIssuer::text(claims);
    const QByteArray good = issuer.token(claims);
    const auto bearer = [](const QByteArray& token) { return "Authorization: Bearer " + token + "\r\n"; };
    const QByteArray bad[] = {
        bearer(issuer.token(TokenIssuer::claimsWith("exp", 1))),
        bearer(other.token(claims)),
        bearer(issuer.signedByPublicKey(TokenIssuer::header("HS256"), body)),
        bearer(base64Url(R"({"alg":"none"})") + '.' + base64Url(body) + '.'),
        bearer(good.chopped(1)),
        bearer(base64Url(QByteArray(20000, 'x'))),
        "Authorization: Bearer\r\n",
        "Authorization: Basic YW5uYTphbm5h\r\n",
        "X-User: anna\r\nCookie: session=anna\r\n",
        "",
    };
    const QByteArray study = "/dicom-web/studies/1.2";
    const QByteArray image = study + "/series/1.2.3/instances/1.2.3.1";
    QByteArrayList paths = {
        "/wado?studyUID=1.2", "/browser/config", "/browser/studies/1.2", "/browser/studies/1.2/corrections",
        "/made-up",           "/healthz"};
    for (const char* below :
         {"studies", "series", "instances", "patients", "changefeed", "wado?studyUID=1.2"})
        paths << QByteArray("/dicom-web/") + below;
    for (const char* below : {"", "/series", "/instances", "/metadata", "/rendered", "/thumbnail",
                              "/bulkdata", "/pixeldata", "/corrections", "/volumes"})
        paths << study + below;
    for (const char* below : {"", "/metadata", "/frames/1", "/frames/1/rendered", "/thumbnail"})
        paths << image + below;
    for (const QByteArray& path : qAsConst(paths)) {
        for (const char* method : {"GET", "HEAD", "POST", "DELETE", "OPTIONS", "PUT"}) {
            for (const QByteArray& headers : bad) {
                const Reply reply = ask(method, path, headers);
                ASSERT_EQ(reply.status, 401) << method << ' ' << path.constData() << '\n'
                                             << headers.constData();
                ASSERT_FALSE(reply.body.contains("anna") || reply.head.contains("anna"));
            }
            const int status = ask(method, path, bearer(good)).status;
            EXPECT_TRUE(status != 401 && status != 0) << method << ' ' << path.constData();
        }
    }
    EXPECT_EQ(ask("GET", study + "/metadata", bearer(good)).status, 200);
    EXPECT_EQ(ask("POST", study, bearer(good)).status, 403);
    mServer.reset();
    const QByteArray trail = fileContent(mStore.filePath("audit.jsonl"));
    EXPECT_TRUE(trail.contains(R"("resource":"metadata","status":200,"studies":["1.2"],"subject":"anna")"));
    EXPECT_FALSE(trail.contains(good.left(20)) || trail.contains(good.right(20)));
}

TEST_F(ServedAccess, ListensToOthersOnlyWhenSomebodyHasDecided)
{
    mSettings.http.address = {"0.0.0.0", 0};
    EXPECT_NE(refusal().find("nobody has decided who may do what"), std::string::npos);
    mSettings.access = AccessRules::open();
    start();
    EXPECT_EQ(ask("GET", "/dicom-web/studies/1.2/metadata").status, 200);
    useTokens(TokenIssuer());
    EXPECT_NE(refusal().find("Tokens are taken over TLS only"), std::string::npos);
    mSettings.addresses.proxies = {"10.0.0.9"};
    start();
    mSettings.addresses.proxies.clear();
    useTls();
    start();
    mSettings.access->audit = "/none/none/audit.jsonl";
    EXPECT_NE(refusal().find("/none/none/audit.jsonl"), std::string::npos);
}

TEST_F(ServedAccess, KnowsClientsByTheirCertificates)
{
    const TlsFiles other;
    mSettings.access = AccessRules();
    mSettings.access->certificates = CertificateRules{other.certificate(), {{"CN=localhost", Right::Read}}};
    EXPECT_NE(refusal().find("over TLS only"), std::string::npos);
    useTls();
    start();
    const TlsFiles stranger;
    const std::pair<const TlsFiles*, int> kClients[] = {{&other, 200}, {nullptr, 403}, {&stranger, 0}};
    for (const auto& [shown, status] : kClients)
        for (const char* version : {"TLSv1.2", "TLSv1.3"}) {
            Client client(mServer->address(), shown, {{"MaxProtocol", version}});
            EXPECT_EQ(client.ask("/dicom-web/studies/1.2/metadata").status, status) << version;
        }
    mSettings.access->certificates->caFile = "/none/ca.pem";
    Result result;
    EXPECT_NE(Server::make(mSettings, result)->start().text().indexOf(QLatin1String("/none/ca.pem")), -1);
}

/// By the eyes of another program.
TEST_F(ServedAccess, KeepsTlsToTodaysPractice)
{
    useTls();
    start();
    const auto said = [&](const char* arguments, const QByteArray& typed) {
        QProcess process;
        process.setProcessChannelMode(QProcess::MergedChannels);
        process.start(QStringLiteral("openssl"),
                      QString::fromLatin1("s_client -connect " + mServer->address().mid(8) + ' ' + arguments)
                          .split(QLatin1Char(' ')));
        process.write(typed);
        process.closeWriteChannel();
        EXPECT_TRUE(process.waitForFinished(60000));
        return process.readAll();
    };
    const std::tuple<const char*, const char*, const char*, bool> kTalks[] = {
        {"-tls1_2", "", "Server Temp Key: X25519", true},
        {"-tls1_2", "", "TLS session ticket", false},
        {"-tls1_2", "", "Secure Renegotiation IS supported", true},
        {"-tls1_2", "R\n", "no renegotiation", true},
        {"-tls1_2", "", "Compression: NONE", true},
        {"-tls1_2 -cipher kRSA:aNULL:DHE:ECDHE+SHA1@SECLEVEL=0", "", "handshake failure", true},
        {"-tls1_3", "", "Cipher is TLS_AES_256_GCM_SHA384", true},
        {"-tls1_1 -cipher ALL@SECLEVEL=0", "", "protocol version", true},
        {"-tls1 -cipher ALL@SECLEVEL=0", "", "protocol version", true},
        {"-tls1_2 -cipher ECDHE-ECDSA-AES128-GCM-SHA256", "", "Cipher is ECDHE-ECDSA-AES128-GCM", true},
        {"-tls1_2 -cipher ECDHE-ECDSA-AES256-SHA384", "", "handshake failure", true},
        {"-no_tls1_3 -cipher ECDHE+CHACHA20", "", "Cipher is ECDHE-ECDSA-CHACHA20-POLY1305", true},
    };
    for (const auto& [arguments, typed, contains, does] : kTalks) {
        const QByteArray text = said(arguments, typed);
        EXPECT_EQ(text.contains(contains), does) << arguments << ": " << contains << '\n' << text.constData();
    }
}

}  // namespace
