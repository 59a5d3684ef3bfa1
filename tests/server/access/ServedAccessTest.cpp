#include "server/ServerFixture.h"
#include "server/access/TokenIssuer.h"

#include <kddlib/TagFile.h>
#include <kddlib/TagMap.h>

using namespace Kdd;
using namespace Kdd::Access;

namespace
{

constexpr qint64 kFarAway = 4'000'000'000;  // [s since 1970]

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
        putFile(mStore.filePath("keys.json"), issuer.keySet());
        const QByteArray file =
            R"({"tokens":{"issuer":"https://login.example","audience":"archive","keys":")" +
            mStore.filePath("keys.json").toUtf8() +
            R"(","rights":[{"claim":"scope","value":"images.read","gives":["read"]}]},"audit":")" +
            mStore.filePath("audit.jsonl").toUtf8() + "\"}";
        ASSERT_EQ(AccessRules::parse(file, mSettings.access.emplace()).text(), QString());
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
    const QJsonObject claims = TokenIssuer::claimsWith("exp", kFarAway);
    const QByteArray body = TokenIssuer::text(claims);
    const QByteArray good = issuer.token(claims);
    const QByteArray bad[] = {
        "Authorization: Bearer " + issuer.token(TokenIssuer::claimsWith("exp", 1)) + "\r\n",
        "Authorization: Bearer " + other.token(claims) + "\r\n",
        "Authorization: Bearer " + issuer.signedByPublicKey(TokenIssuer::header("HS256"), body) + "\r\n",
        "Authorization: Bearer " + base64Url(R"({"alg":"none"})") + '.' + base64Url(body) + ".\r\n",
        "Authorization: Bearer " + good.chopped(1) + "\r\n",
        "Authorization: Bearer " + base64Url(QByteArray(20000, 'x')) + "\r\n",
        "Authorization: Bearer\r\n",
        "Authorization: Basic YW5uYTphbm5h\r\n",
        "X-User: anna\r\nCookie: session=anna\r\n",
        "",
    };
    const QByteArray study = "/dicom-web/studies/1.2";
    const QByteArray image = study + "/series/1.2.3/instances/1.2.3.1";
    const QByteArray paths[] = {"/dicom-web/studies",
                                "/dicom-web/series",
                                "/dicom-web/instances",
                                "/dicom-web/patients",
                                "/dicom-web/changefeed",
                                "/dicom-web/wado?studyUID=1.2",
                                study,
                                study + "/series",
                                study + "/instances",
                                study + "/metadata",
                                study + "/rendered",
                                study + "/thumbnail",
                                study + "/bulkdata",
                                study + "/pixeldata",
                                study + "/corrections",
                                study + "/volumes",
                                image,
                                image + "/metadata",
                                image + "/frames/1",
                                image + "/frames/1/rendered",
                                image + "/thumbnail",
                                "/wado?studyUID=1.2",
                                "/browser/config",
                                "/browser/studies/1.2",
                                "/browser/studies/1.2/corrections",
                                "/made-up",
                                "/healthz"};
    for (const QByteArray& path : paths) {
        for (const char* method : {"GET", "HEAD", "POST", "DELETE", "OPTIONS", "PUT"}) {
            for (const QByteArray& headers : bad) {
                const Reply reply = ask(method, path, headers);
                ASSERT_EQ(reply.status, 401) << method << ' ' << path.constData() << '\n'
                                             << headers.constData();
                ASSERT_FALSE(reply.body.contains("anna") || reply.head.contains("anna"));
            }
            const int status = ask(method, path, "Authorization: Bearer " + good + "\r\n").status;
            EXPECT_TRUE(status != 401 && status != 0) << method << ' ' << path.constData();
        }
    }
    EXPECT_EQ(ask("GET", study + "/metadata", "Authorization: Bearer " + good + "\r\n").status, 200);
    EXPECT_EQ(ask("POST", study, "Authorization: Bearer " + good + "\r\n").status, 403);
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
    const struct
    {
        const TlsFiles* shown;
        int status;
    } kClients[] = {{&other, 200}, {nullptr, 403}, {&stranger, 0}};
    for (const auto& each : kClients)
        for (const char* version : {"TLSv1.2", "TLSv1.3"}) {
            Client client(mServer->address(), each.shown, {{"MaxProtocol", version}});
            client.get("/dicom-web/studies/1.2/metadata");
            EXPECT_EQ(client.reply().status, each.status) << version;
        }
    mSettings.access->certificates->caFile = "/none/ca.pem";
    Result result;
    EXPECT_NE(Server::make(mSettings, result)->start().text().indexOf(QLatin1String("/none/ca.pem")), -1);
}

TEST_F(ServedAccess, SpeaksNoOldTls)
{
    useTls();
    start();
    const struct
    {
        const char* version;
        const char* ciphers;
        int status;
    } kOffers[] = {
        {"TLSv1.3", "DEFAULT", 404},
        {"TLSv1.2", "DEFAULT", 404},
        {"TLSv1.2", "ECDHE-ECDSA-AES128-GCM-SHA256", 404},
        {"TLSv1.2", "ECDHE-ECDSA-AES256-SHA384", 0},
        {"TLSv1.1", "DEFAULT@SECLEVEL=0", 0},
        {"TLSv1", "DEFAULT@SECLEVEL=0", 0},
    };
    for (const auto& each : kOffers) {
        Client client(
            mServer->address(), nullptr,
            {{"MinProtocol", "None"}, {"MaxProtocol", each.version}, {"CipherString", each.ciphers}});
        client.get("/made-up");
        EXPECT_EQ(client.reply().status, each.status) << each.version << ' ' << each.ciphers;
    }
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
    const struct
    {
        const char* arguments;
        const char* typed;
        const char* contains;
        bool does;
    } kTalks[] = {
        {"-tls1_2", "", "Server Temp Key: X25519", true},
        {"-tls1_2", "", "TLS session ticket", false},
        {"-tls1_2", "", "Secure Renegotiation IS supported", true},
        {"-tls1_2", "R\n", "no renegotiation", true},
        {"-tls1_2", "", "Compression: NONE", true},
        {"-tls1_2 -cipher kRSA:aNULL:DHE:ECDHE+SHA1@SECLEVEL=0", "", "handshake failure", true},
        {"-tls1_3", "", "Cipher is TLS_AES_256_GCM_SHA384", true},
        {"-tls1_1 -cipher ALL@SECLEVEL=0", "", "protocol version", true},
        {"-no_tls1_3 -cipher ECDHE+CHACHA20", "", "Cipher is ECDHE-ECDSA-CHACHA20-POLY1305", true},
    };
    for (const auto& each : kTalks) {
        const QByteArray text = said(each.arguments, each.typed);
        EXPECT_EQ(text.contains(each.contains), each.does) << each.arguments << ": " << each.contains << '\n'
                                                           << text.constData();
    }
}

}  // namespace
