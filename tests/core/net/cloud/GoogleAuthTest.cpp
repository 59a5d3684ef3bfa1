#include "kddlib/net/KxCurlClient.h"
#include "kddlib/net/cloud/KxCurlUploadStream.h"
#include "kddlib/net/cloud/KxGoogleAuth.h"
#include "kddlib/net/http/KxHttpStatus.h"
#include "support/CloudStore.h"
#include "support/FileContent.h"
#include "support/LogCapture.h"
#include "support/ObjectServer.h"
#include "support/ServiceAccount.h"
#include "support/Threads.h"

#include <QJsonDocument>
#include <QSet>
#include <QTemporaryFile>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>

using namespace Kdd;

namespace
{

constexpr qint64 kSecond = 10'000'000;  // [100 ns]
constexpr char kParsing[] = "Could not parse PEM to get private key.";

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

/// What a place of tokens was sent and what it answers.
class GoogleAuth : public testing::Test
{
protected:
    static QJsonObject key() { return account().key("http://tokens/a"); }

    QByteArray header()
    {
        return auth.authorizationHeader([this](const std::string& url, const QByteArray& form, auto& result) {
            const std::lock_guard lock(mutex);
            asked.push_back({url, form});
            result = status;
            return QJsonDocument::fromJson(answer);
        });
    }

    /// A part of what the last form asserts.
    QByteArray token(int part) const
    {
        const QByteArray start =
            "grant_type=urn%3Aietf%3Aparams%3Aoauth%3Agrant-type%3Ajwt-bearer&assertion=";
        const QByteArray form = asked.back().second;
        EXPECT_TRUE(form.startsWith(start)) << form.constData();
        EXPECT_FALSE(form.mid(start.size()).contains('='));
        return form.mid(start.size()).split('.').value(part);
    }

    static QByteArray decoded(const QByteArray& text)
    {
        return QByteArray::fromBase64(text, QByteArray::Base64UrlEncoding);
    }

    qint64 now = 1'700'000'000 * kSecond + 9'999'999;
    KxGoogleAuth auth{[this] { return now; }};
    KxHttpStatus status = {200, {}};
    QByteArray answer = R"({"access_token":"t.1","token_type":"Bearer","expires_in":3600})";
    std::mutex mutex;
    std::vector<std::pair<std::string, QByteArray>> asked;
};

TEST_F(GoogleAuth, AssertsWhoItIsWithASignatureThatOpensslVerifies)
{
    ASSERT_TRUE(auth.loadCredentialsFromJson(key(), "test"));
    EXPECT_EQ(header(), "Authorization: Bearer t.1");
    EXPECT_EQ(asked.back().first, "http://tokens/a");
    EXPECT_EQ(decoded(token(0)), R"({"alg":"RS256","kid":"k1","typ":"JWT"})");
    EXPECT_EQ(decoded(token(1)),
              R"({"aud":"http://tokens/a","exp":1700003600,"iat":1700000000,"iss":"robot@hospital",)"
              R"("scope":"https://www.googleapis.com/auth/cloud-platform"})");
    account().save("text", token(0) + '.' + token(1));
    account().save("signature", decoded(token(2)));
    EXPECT_EQ(account().openssl("dgst -sha256 -verify public.pem -signature signature text"), "Verified OK");
    auth.setScopes({"read", "write"});
    auth.setSubject("jos\xC3\xA9@hospital");
    header();
    EXPECT_TRUE(decoded(token(1)).contains("\"scope\":\"read write\",\"sub\":\"jos\xC3\xA9@hospital\""));
}

TEST_F(GoogleAuth, KeepsATokenUntil500SecondsBeforeItsEnd)
{
    const auto requestsFor = [this](const char* lifetime, qint64 later) {
        answer = QByteArray(R"({"access_token":"t","token_type":"Bearer","expires_in":)") + lifetime + '}';
        auth.loadCredentialsFromJson(key(), "test");
        const size_t before = asked.size();
        header();
        now += later;
        header();
        return asked.size() - before;
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
    onThreads(16, [this](int) { EXPECT_EQ(header(), "Authorization: Bearer t.1"); });
    EXPECT_EQ(asked.size(), 1U);
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
        {"private_key", "", "Field 'private_key' is missing in a.json"},
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
    const QByteArray good = QJsonDocument(with(key(), "token_uri", "")).toJson();
    struct
    {
        std::string variable;
        QByteArray content;
        std::string message;
    } const kCases[] = {{"", "", "Environment variable GOOGLE_APPLICATION_CREDENTIALS not defined"},
                        {"/absent.json", "", "ADC file /absent.json does not exist"},
                        {name, "{\"type\":", "Could not read Json document from " + name},
                        {name, good + QByteArray(65536, ' '), "Could not read Json document from " + name},
                        {name, "[1]", "Empty Json object in " + name},
                        {name, good, ""}};
    const Setting place("KDD_CLOUD_TOKEN", "http://default/");
    Setting variable("GOOGLE_APPLICATION_CREDENTIALS", "");
    for (const auto& one : kCases) {
        const LogCapture log;
        putFile(file.fileName(), one.content);
        variable.set(one.variable);
        EXPECT_EQ(header().isEmpty(), !one.message.empty()) << one.message;
        EXPECT_EQ(log.count(one.message), int(log.lines().size())) << testing::PrintToString(log.lines());
    }
    ASSERT_EQ(asked.size(), 1U);
    EXPECT_EQ(asked.back().first, "http://default/");
    EXPECT_TRUE(decoded(token(1)).contains("\"aud\":\"http://default/\""));
}

TEST_F(GoogleAuth, SendsNothingThatItCannotSign)
{
    const QByteArray pem = account().openssl("pkey -in private.pem");
    const QByteArray kKeys[] = {account().openssl("pkey -in private.pem -aes256 -passout pass:secret"),
                                account().openssl("ecparam -name prime256v1 -genkey -noout"),
                                pem.left(pem.size() / 2)};
    for (const QByteArray& bad : kKeys) {
        const LogCapture log;
        ASSERT_NE(bad, "failed");
        ASSERT_TRUE(auth.loadCredentialsFromJson(with(key(), "private_key", bad), "test"));
        EXPECT_EQ(header(), QByteArray());
        EXPECT_THAT(log.lines(), testing::ElementsAre(kParsing));
    }
    EXPECT_TRUE(asked.empty());
}

TEST_F(GoogleAuth, RefusesAnswersWithoutAUsableToken)
{
    const KxHttpStatus kUnreached = {0, {}, true, 0, 0, "Failed to connect"};
    struct
    {
        KxHttpStatus status;
        QByteArray answer;
        std::string message;
    } const kCases[] = {
        {{401, {}}, R"({ "error" : "invalid_grant" })", R"(response code 401. {"error":"invalid_grant"})"},
        {kUnreached, "", "from http://tokens/a, response code 0. Failed to connect"},
        {{200, {}}, R"({"access_token":"secret"})", R"(authorization response. {"access_token":"..."})"},
        {{200, {}}, R"({"access_token":"a\r\nX: 1","token_type":"Bearer"})", "Invalid authorization"},
        {{200, {}}, "[]", "Invalid authorization response. []"}};
    auth.loadCredentialsFromJson(key(), "test");
    for (const auto& one : kCases) {
        const LogCapture log;
        status = one.status;
        answer = one.answer;
        EXPECT_EQ(header(), QByteArray());
        EXPECT_EQ(log.count(one.message), 1) << testing::PrintToString(log.lines());
    }
}

/// How many different tokens the requests carried.
int tokensOf(const std::vector<QByteArray>& requests)
{
    QSet<QByteArray> lines;
    for (const QByteArray& request : requests)
        lines.insert(headerOf(request, "Authorization"));
    EXPECT_FALSE(lines.contains(""));
    return lines.size();
}

TEST(CloudClient, AuthorizesEachRangeChunkAndDeletionByTheTokenOfItsTime)
{
    std::atomic<int> count{0};
    const ScriptedServer tokens([&](const QByteArray&) -> ScriptedServer::Reply {
        return {httpResponse(R"({"token_type":"Bearer","expires_in":0,"access_token":"t)" +
                             QByteArray::number(++count) + "\"}")};
    });
    const LogCapture log;
    KxCurlClient& client = KxCurlClient::instance();
    client.setSessionID("12");
    client.setGoogleAuthentication(account().key(tokens.url("")));
    const ObjectServer object(someObject(8000));
    const Setting host("KDD_CLOUD_DOWNLOAD", object.origin());
    client.setNumConcurrentRequestsPerFile(2);
    client.setChunkSizeForPartialRequests(2000);
    KxHttpStatus status;
    EXPECT_EQ(client.readBytes("gs://b/x", status), someObject(8000));
    client.setNumConcurrentRequestsPerFile(1);
    EXPECT_EQ(tokensOf(object.requests()), 4);

    const CloudStore store;
    KxCurlUploadStream stream = client.write("gs://b/long");
    for (int i = 0; i < 3; ++i)
        stream << std::string(262'144, 'x') << std::flush;
    stream.close();
    EXPECT_TRUE(stream.good());
    EXPECT_FALSE(client.deleteObject("gs://b/x/y"));  // which this store refuses
    client.setSessionID({});
    EXPECT_EQ(store.requests().size(), 6U);
    EXPECT_EQ(tokensOf(store.requests()), 6);
    EXPECT_TRUE(tokens.requests().back().startsWith("POST / HTTP/1.1\r\n")) << "without the session";
    EXPECT_TRUE(tokens.requests().back().contains("\r\nContent-Type: application/x-www-form-urlencoded\r\n"));
}

}  // namespace
