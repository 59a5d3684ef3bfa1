#include "kddlib/net/KxCurlClient.h"
#include "kddlib/net/cloud/KxCurlUploadStream.h"
#include "kddlib/net/cloud/KxGoogleAuth.h"
#include "kddlib/net/http/KxHttpStatus.h"
#include "support/CloudStore.h"
#include "support/LogCapture.h"
#include "support/ObjectServer.h"

#include <QFile>
#include <QFileInfo>
#include <QJsonDocument>
#include <QJsonObject>
#include <QProcess>
#include <QSet>
#include <QTemporaryDir>
#include <QTemporaryFile>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>

using namespace Kdd;

namespace
{

constexpr qint64 kSecond = 10'000'000;  // [100 ns]
constexpr char kParsing[] = "Could not parse PEM to get private key.";

/// A service account with a key pair of its own, made by the openssl tool.
class ServiceAccount
{
public:
    ServiceAccount()
    {
        openssl("genpkey -algorithm RSA -pkeyopt rsa_keygen_bits:2048 -out private.pem");
        openssl("pkey -in private.pem -pubout -out public.pem");
    }

    /// As the provider hands it out, for tokens from `tokenUri`.
    QJsonObject key(const std::string& tokenUri) const
    {
        return {{QStringLiteral("type"), QStringLiteral("service_account")},
                {QStringLiteral("private_key_id"), QStringLiteral("k1")},
                {QStringLiteral("private_key"), QString::fromLatin1(openssl("pkey -in private.pem"))},
                {QStringLiteral("client_email"), QStringLiteral("robot@hospital")},
                {QStringLiteral("token_uri"), QString::fromStdString(tokenUri)}};
    }

    /// Runs a program in the folder of the keys; what it says when it succeeds.
    QByteArray run(const char* program, const QStringList& arguments) const
    {
        QProcess process;
        process.setWorkingDirectory(mFolder.path());
        process.start(QLatin1String(program), arguments);
        const bool isDone = process.waitForFinished() && process.exitCode() == 0;
        return isDone ? process.readAllStandardOutput().trimmed() : QByteArray("failed");
    }

    QByteArray openssl(const char* arguments) const
    {
        return run("openssl", QString::fromLatin1(arguments).split(QLatin1Char(' ')));
    }

    void save(const char* name, const QByteArray& content) const
    {
        QFile file(mFolder.filePath(QLatin1String(name)));
        EXPECT_TRUE(file.open(QIODevice::WriteOnly) && file.write(content) == content.size());
    }

private:
    QTemporaryDir mFolder;
};

const ServiceAccount& account()
{
    static const ServiceAccount made;
    return made;
}

QJsonObject with(QJsonObject key, const char* field, const QByteArray& value)
{
    key[QLatin1String(field)] = QString::fromLatin1(value);
    return key;
}

class GoogleAuth : public testing::Test
{
protected:
    ~GoogleAuth() override { qunsetenv("GOOGLE_APPLICATION_CREDENTIALS"); }

    QJsonObject key() const { return account().key(server.url("token")); }
    QByteArray header() { return auth.authorizationHeader(KxCurlClient::instance()); }

    /// What the last request asserts.
    QByteArray token() const
    {
        const QByteArray body = server.requests().back().split('\n').last();
        const QByteArray start =
            "grant_type=urn%3Aietf%3Aparams%3Aoauth%3Agrant-type%3Ajwt-bearer&assertion=";
        EXPECT_TRUE(body.startsWith(start)) << body.toStdString();
        return body.mid(start.size());
    }

    static QByteArray decoded(const QByteArray& text)
    {
        return QByteArray::fromBase64(text, QByteArray::Base64UrlEncoding);
    }

    qint64 now = 1'700'000'000 * kSecond + 9'999'999;
    KxGoogleAuth auth{[this] { return now; }};
    QByteArray code = "200 OK";
    QByteArray answer = R"({"access_token":"t.1","token_type":"Bearer","expires_in":3600})";
    ScriptedServer server{[this](const QByteArray&) -> ScriptedServer::Reply {
        return {"HTTP/1.1 " + code + "\r\nContent-Length: " + QByteArray::number(answer.size()) + "\r\n\r\n" +
                answer};
    }};
};

TEST_F(GoogleAuth, AssertsWhoItIsWithASignatureThatOpensslVerifies)
{
    ASSERT_TRUE(auth.loadCredentialsFromJson(key(), "test"));
    EXPECT_EQ(header(), "Authorization: Bearer t.1");
    EXPECT_TRUE(server.requests().back().contains("\r\nContent-Type: application/x-www-form-urlencoded\r\n"));
    const QList<QByteArray> parts = token().split('.');
    ASSERT_EQ(parts.size(), 3);
    EXPECT_FALSE(token().contains('='));
    EXPECT_EQ(decoded(parts[0]), R"({"alg":"RS256","kid":"k1","typ":"JWT"})");
    EXPECT_EQ(decoded(parts[1]), R"({"aud":")" + QByteArray::fromStdString(server.url("token")) +
                                     R"(","exp":1700003600,"iat":1700000000,"iss":"robot@hospital",)"
                                     R"("scope":"https://www.googleapis.com/auth/cloud-platform"})");
    account().save("text", parts[0] + '.' + parts[1]);
    account().save("signature", decoded(parts[2]));
    EXPECT_EQ(account().openssl("dgst -sha256 -verify public.pem -signature signature text"), "Verified OK");
}

TEST_F(GoogleAuth, AssertsWhatAnotherImplementationAccepts)
{
    const char* const program = "/usr/bin/python3";
    if (account().run(program, {QStringLiteral("-c"), QStringLiteral("import jwt, cryptography")}) ==
        "failed")
        GTEST_SKIP() << "No python3-jwt";
    ASSERT_TRUE(auth.loadCredentialsFromJson(key(), "test"));
    auth.setScopes({"read", "write"});
    auth.setSubject("jos\xC3\xA9@hospital");
    header();
    const QString script = QStringLiteral(
        "import jwt, sys; claims = jwt.decode(sys.argv[1], open('public.pem').read(), algorithms=['RS256'],"
        " audience=sys.argv[2], options={'verify_exp': False}); print(ascii([claims['scope'], "
        "claims['sub']]))");
    EXPECT_EQ(account().run(program, {QStringLiteral("-c"), script, QString::fromLatin1(token()),
                                      QString::fromStdString(server.url("token"))}),
              "['read write', 'jos\\xe9@hospital']");
}

TEST_F(GoogleAuth, KeepsATokenUntil500SecondsBeforeItsEnd)
{
    const auto requestsFor = [this](const char* lifetime, qint64 later) {
        answer = QByteArray(R"({"access_token":"t","token_type":"Bearer","expires_in":)") + lifetime + '}';
        auth.loadCredentialsFromJson(key(), "test");
        const size_t before = server.requests().size();
        header();
        now += later;
        header();
        return server.requests().size() - before;
    };
    const std::pair<const char*, qint64> kKept[] = {
        {"3600", 3100}, {"501", 1}, {"500", 0}, {"1e300", 999'999'500}};  // [s]
    for (const auto& [lifetime, seconds] : kKept) {
        EXPECT_EQ(requestsFor(lifetime, seconds * kSecond), 1U) << lifetime;
        EXPECT_EQ(requestsFor(lifetime, seconds * kSecond + 1), 2U) << lifetime;
    }
    for (const char* lifetime : {"499", "0", "-1e300", "\"3600\""})
        EXPECT_EQ(requestsFor(lifetime, 0), 2U) << lifetime;
}

TEST_F(GoogleAuth, FetchesOneTokenForAllThreads)
{
    auth.loadCredentialsFromJson(key(), "test");
    std::vector<std::thread> threads;
    for (int i = 0; i < 16; ++i)
        threads.emplace_back([this] { EXPECT_EQ(header(), "Authorization: Bearer t.1"); });
    for (std::thread& thread : threads)
        thread.join();
    EXPECT_EQ(server.requests().size(), 1U);
}

TEST_F(GoogleAuth, NamesWhatIsWrongWithAKeyAndKeepsTheFormerOne)
{
    struct
    {
        const char* field;
        const char* value;
        const char* message;
    } const kCases[] = {
        {"type", "authorized_user",
         "Credential type is 'authorized_user' in a.json, expected 'service_account'"},
        {"private_key_id", "", "Field 'private_key_id' is missing in a.json"},
        {"private_key", "", "Field 'private_key' is missing in a.json"},
        {"client_email", "", "Field 'client_email' is missing in a.json"},
        {"token_uri", "gs://b/o", "Field 'token_uri' is 'gs://b/o' in a.json, which is no web address"}};
    ASSERT_TRUE(auth.loadCredentialsFromJson(key(), "test"));
    for (const auto& [field, value, message] : kCases) {
        const LogCapture log;
        EXPECT_FALSE(auth.loadCredentialsFromJson(with(key(), field, value), "a.json"));
        EXPECT_THAT(log.lines(), testing::ElementsAre(message));
    }
    EXPECT_EQ(header(), "Authorization: Bearer t.1");
}

TEST_F(GoogleAuth, ReadsTheKeyFromTheFileThatTheEnvironmentNames)
{
    QTemporaryFile file;
    ASSERT_TRUE(file.open());
    const std::string name = file.fileName().toStdString();
    const std::string folder = QFileInfo(file).path().toStdString();
    const QByteArray good = QJsonDocument(with(key(), "token_uri", "")).toJson();
    struct
    {
        std::string variable;
        QByteArray content;
        std::string message;
    } const kCases[] = {
        {"", "", "Environment variable GOOGLE_APPLICATION_CREDENTIALS not defined"},
        {"/absent.json", "", "ADC file /absent.json does not exist"},
        {folder, "", "Could not open " + folder + ": "},
        {name, "{\"type\":", "Could not read Json document from " + name},
        {name, good + QByteArray(65536, ' '), "Could not read Json document from " + name},
        {name, "[1]", "Empty Json object in " + name},
        {name, "{}", "Empty Json object in " + name},
        {name, "{\"a\":1}", "Credential type is '' in " + name + ", expected 'service_account'"},
        {name, good, ""}};
    qputenv("KDD_CLOUD_TOKEN", server.url("default").c_str());
    for (const auto& one : kCases) {
        const LogCapture log;
        file.resize(0);
        file.seek(0);
        file.write(one.content);
        file.flush();
        qputenv("GOOGLE_APPLICATION_CREDENTIALS", one.variable.c_str());
        EXPECT_EQ(header().isEmpty(), !one.message.empty()) << one.message;
        EXPECT_EQ(log.count(one.message), int(log.lines().size())) << testing::PrintToString(log.lines());
    }
    qunsetenv("KDD_CLOUD_TOKEN");
    ASSERT_EQ(server.requests().size(), 1U);
    EXPECT_TRUE(decoded(token().split('.')[1]).contains("\"aud\":\"http://127.0.0.1:"));
    EXPECT_TRUE(server.requests().back().startsWith("POST /default "));
}

TEST_F(GoogleAuth, SendsNothingThatItCannotSign)
{
    const QByteArray pem = account().openssl("pkey -in private.pem");
    const QByteArray kKeys[] = {account().openssl("pkey -in private.pem -aes256 -passout pass:secret"),
                                account().openssl("ecparam -name prime256v1 -genkey -noout"),
                                pem.left(pem.size() / 2), "secret"};
    for (const QByteArray& bad : kKeys) {
        const LogCapture log;
        ASSERT_NE(bad, "failed");
        ASSERT_TRUE(auth.loadCredentialsFromJson(with(key(), "private_key", bad), "test"));
        EXPECT_EQ(header(), QByteArray());
        EXPECT_THAT(log.lines(), testing::ElementsAre(kParsing));
    }
    EXPECT_TRUE(server.requests().empty());
}

TEST_F(GoogleAuth, RefusesAnswersWithoutAUsableToken)
{
    struct
    {
        QByteArray code;
        QByteArray answer;
        std::string message;
    } const kCases[] = {{"401 Unauthorized", R"({ "error" : "invalid_grant" })",
                         R"(response code 401. {"error":"invalid_grant"})"},
                        {"500 Oops", "sorry", "response code 500. "},
                        {"200 OK", R"({"access_token":"secret"})",
                         R"(Invalid authorization response. {"access_token":"..."})"},
                        {"200 OK", R"({"token_type":"Bearer"})",
                         R"(Invalid authorization response. {"token_type":"Bearer"})"},
                        {"200 OK", R"({"access_token":"a\r\nX: 1","token_type":"Bearer"})",
                         "Invalid authorization response."},
                        {"200 OK", "[]", "Invalid authorization response. []"}};
    auth.loadCredentialsFromJson(key(), "test");
    for (const auto& one : kCases) {
        const LogCapture log;
        code = one.code;
        answer = one.answer;
        EXPECT_EQ(header(), QByteArray());
        EXPECT_EQ(log.count(one.message), 1) << testing::PrintToString(log.lines());
    }
}

TEST_F(GoogleAuth, IsToldNoSession)
{
    KxCurlClient::instance().setSessionID("12");
    ASSERT_TRUE(auth.loadCredentialsFromJson(key(), "test"));
    EXPECT_FALSE(header().isEmpty());
    KxCurlClient::instance().setSessionID({});
    EXPECT_TRUE(server.requests().back().startsWith("POST /token HTTP/1.1\r\n"));
}

TEST_F(GoogleAuth, TellsWhyThePlaceOfTokensCannotBeReached)
{
    const LogCapture log;
    ASSERT_TRUE(auth.loadCredentialsFromJson(account().key("http://127.0.0.1:1/t"), "test"));
    EXPECT_EQ(header(), QByteArray());
    EXPECT_EQ(log.count("from http://127.0.0.1:1/t, response code 0. Failed to connect"), 1);
}

TEST(CloudClient, AuthorizesWhatItUploadsAndDeletes)
{
    const LogCapture log;
    const CloudStore store;
    const ScriptedServer tokens([](const QByteArray&) -> ScriptedServer::Reply {
        return {
            "HTTP/1.1 200 OK\r\n\r\n{\"access_token\":\"t\",\"token_type\":\"Bearer\",\"expires_in\":3600}"};
    });
    KxCurlClient& client = KxCurlClient::instance();
    client.setGoogleAuthentication(account().key(tokens.url("")));
    KxCurlUploadStream stream = client.write("gs://b/x/y");
    stream << "bytes";
    stream.close();
    EXPECT_TRUE(stream.good());
    EXPECT_EQ(store.object("b/x%2Fy"), "bytes");
    EXPECT_FALSE(client.deleteObject("gs://b/x/y"));  // which this store refuses
    EXPECT_TRUE(store.requests().back().startsWith("DELETE /b/x%2Fy HTTP/1.1\r\n"));
    for (const QByteArray& request : store.requests())
        EXPECT_TRUE(request.contains("\r\nAuthorization: Bearer t\r\n")) << request.toStdString();
    EXPECT_EQ(tokens.requests().size(), 1U);
    for (const char* address : {"https://a/b", "gs://b", "gs://b/", "gs:"})
        EXPECT_THROW(client.write(address), std::invalid_argument) << address;
}

/// A client that is given another token for each request.
class ShortTokens : public testing::Test
{
protected:
    ShortTokens() { client.setGoogleAuthentication(account().key(tokens.url(""))); }

    /// How many different tokens the requests carried.
    static int tokensOf(const std::vector<QByteArray>& requests)
    {
        QSet<QByteArray> lines;
        for (const QByteArray& request : requests)
            lines.insert(request.mid(request.indexOf("\r\nAuthorization: ") + 2, 26));
        EXPECT_FALSE(lines.contains(""));
        return lines.size();
    }

    std::atomic<int> count{0};
    const ScriptedServer tokens{[this](const QByteArray&) -> ScriptedServer::Reply {
        return {"HTTP/1.1 200 OK\r\n\r\n{\"access_token\":\"t" + QByteArray::number(++count) +
                "\",\"token_type\":\"Bearer\",\"expires_in\":0}"};
    }};
    KxCurlClient& client = KxCurlClient::instance();
};

TEST_F(ShortTokens, AuthorizeEachRangeByThatOfItsTime)
{
    const ObjectServer store(someObject(8000));
    qputenv("KDD_CLOUD_DOWNLOAD", store.origin().c_str());
    client.setNumConcurrentRequestsPerFile(2);
    client.setChunkSizeForPartialRequests(2000);
    KxHttpStatus status;
    EXPECT_EQ(client.readBytes("gs://b/x", status), someObject(8000));
    qunsetenv("KDD_CLOUD_DOWNLOAD");
    client.setNumConcurrentRequestsPerFile(1);
    EXPECT_EQ(tokensOf(store.requests()), 4);
}

TEST_F(ShortTokens, AuthorizeEachChunkByThatOfItsTime)
{
    const CloudStore store;
    KxCurlUploadStream stream = client.write("gs://b/long");
    for (int i = 0; i < 3; ++i)
        stream << std::string(262'144, 'x') << std::flush;
    stream.close();
    EXPECT_TRUE(stream.good());
    EXPECT_EQ(store.requests().size(), 5U);
    EXPECT_EQ(tokensOf(store.requests()), 5);
}

}  // namespace
