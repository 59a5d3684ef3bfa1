#include "kddlib/net/KxCurlClient.h"
#include "kddlib/net/cloud/KxCurlUploadStream.h"
#include "kddlib/net/http/CurlError.h"
#include "kddlib/net/http/KxCurlDownloadStream.h"
#include "kddlib/net/http/KxCurlHandleFactory.h"
#include "platform/base/Result.h"
#include "support/HttpServer.h"
#include "support/LogCapture.h"
#include "support/Setting.h"
#include "support/Threads.h"

#include <QJsonDocument>
#include <QJsonObject>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <set>

using namespace Kdd;
using testing::EndsWith;
using testing::HasSubstr;
using testing::StartsWith;

namespace
{

class Client : public testing::Test
{
protected:
    ~Client() override { client.setSessionID({}); }

    std::string lastRequest() const { return server.requests().back().toStdString(); }

    KxCurlClient& client = KxCurlClient::instance();
    KxHttpStatus status;
    ScriptedServer server{
        "HTTP/1.1 103 Early Hints\r\n\r\nHTTP/1.1 200 OK\r\nX-Two:  b \r\nX-TWO:c: d\r\n\r\n{\"a\": 1}"};
    Setting cloud{"KDD_CLOUD_API", server.url("")};
};

TEST_F(Client, ReadsWhatIsTrustedFromNobodyElse)
{
    const auto read = [this](const std::string& url, const QByteArray& caFile = {}, qint64 most = 1000) {
        QByteArray body = "as it was";
        const Result result = client.readTrusted(url, caFile, most, std::chrono::seconds(60), body);
        return result.good() ? body.toStdString()
                             : (body == "as it was" ? "" : "changed: ") + result.text().toStdString();
    };
    client.setSessionID("secret");
    EXPECT_EQ(read(server.url("a")), "{\"a\": 1}");
    EXPECT_THAT(lastRequest(), StartsWith("GET /a HTTP/1.1"));
    EXPECT_THAT(read(server.url("a"), {}, 7), HasSubstr("a body of more than 7 bytes"));
    EXPECT_THAT(read("http://192.0.2.1/a"), StartsWith("http://192.0.2.1/a: it is no address of HTTPS"));
    EXPECT_THAT(read("file:///etc/hostname"), HasSubstr("no address of HTTPS"));
    const NginxServer secure(NginxServer::Scheme::Https, "location /moved { return 302 /a; }");
    secure.addFile("a", "of the server");
    const Setting verifiesNobody("KDD_TLS_VERIFY", "0");
    EXPECT_THAT(read(secure.url("a")), HasSubstr("certificate"));
    EXPECT_EQ(read(secure.url("a"), secure.certificateFile()), "of the server");
    EXPECT_THAT(read(secure.url("moved"), secure.certificateFile()), HasSubstr("HTTP response code 302"));
    const Setting trusted("KDD_TLS_CA_FILE", secure.certificateFile().toStdString());
    EXPECT_EQ(read(secure.url("a")), "of the server");
}

TEST(ClientNames, AreToldFromFilesByTheirFirstLettersAndLeadToTheWebService)
{
    for (const char* file : {"", "h", "ftp://a", static_cast<const char*>(nullptr)})
        EXPECT_FALSE(KxCurlClient::isUrl(file));
    EXPECT_TRUE(KxCurlClient::isUrl("gsx") && KxCurlClient::isUrl("https://a"));
    const Setting host("KDD_WEB_HOST", "pacs:8443");
    EXPECT_EQ(KxCurlClient::url("GetStudy?x=1"), "https://pacs:8443/quil/Browser.svc/GetStudy?x=1");
}

TEST(HandleFactory, ForgetsTheOptionsOfAnEasyHandleAtOnce)
{
    KxCurlHandleFactory factory(1);
    CurlEasy handle = factory.takeEasy();
    CURL* const name = handle.get();
    curl_easy_setopt(name, CURLOPT_PRIVATE, name);
    factory.giveBack(std::move(handle));
    void* kept = name;
    curl_easy_getinfo(name, CURLINFO_PRIVATE, &kept);
    EXPECT_EQ(kept, nullptr);
}

TEST_F(Client, KeepsHeadersByNameAndTheCodeOfTheFinalAnswer)
{
    client.setSessionID("12");
    EXPECT_EQ(client.readJson(server.url("j"), status).object()[QStringLiteral("a")], 1);
    EXPECT_EQ(status.code, 200);
    EXPECT_EQ(status.headers.at("x-two"), "c: d");
    EXPECT_EQ(status.headers.at("http/1.1 200 ok"), "");
    EXPECT_THAT(lastRequest(), StartsWith("GET /j?s=12 HTTP/1.1\r\n"));
}

TEST_F(Client, PostsBytesWithTheirTypeAndReadsTheAnswer)
{
    const QByteArray large(2'000'000, 'y');  // for which curl would ask leave first
    EXPECT_EQ(client.postBytes(server.url("p"), large, "text/plain", status).object().size(), 1);
    EXPECT_THAT(lastRequest(), StartsWith("POST /p HTTP/1.1\r\n"));
    EXPECT_THAT(lastRequest(), HasSubstr("\r\nContent-Type: text/plain\r\n"));
    EXPECT_THAT(lastRequest(), Not(HasSubstr("Expect:")));
    EXPECT_TRUE(server.requests().back().endsWith("\r\n\r\n" + large));
    client.postJson(server.url("p"), {{QStringLiteral("k"), 2}}, status);
    EXPECT_THAT(lastRequest(), HasSubstr("\r\nContent-Type: application/json\r\n"));
    EXPECT_THAT(lastRequest(), EndsWith("\r\n\r\n{\n    \"k\": 2\n}\n"));
}

TEST_F(Client, SendsNothingThatIsNotWhatItSeems)
{
    const LogCapture log;  // of the missing credentials
    const Setting upload("KDD_CLOUD_UPLOAD", server.url(""));
    EXPECT_THROW(client.postBytes(server.url("p"), "b", "a\r\nX-Admin: 1", status), std::runtime_error);
    EXPECT_THROW(client.readBytes(server.url(std::string("a\0b", 3)), status), CurlError);
    EXPECT_THROW(client.deleteObject("gs://b/o?generation=5"), std::invalid_argument);
    EXPECT_THROW(client.write("gs://b/.."), std::invalid_argument);
    EXPECT_TRUE(client.deleteObject(server.url("x")));
    EXPECT_EQ(client.readBytes("file:///etc/hostname", status), QByteArray());
    EXPECT_TRUE(status.failed);
    EXPECT_TRUE(server.requests().empty());
    client.readBytes(server.url("a/../b"), status);
    EXPECT_THAT(lastRequest(), StartsWith("GET /a/../b HTTP/1.1\r\n"));
}

struct ServerFault
{
    ScriptedServer::Reply reply;
    const char* body;
    const char* reason;
};

const ServerFault kServerFaults[] = {
    {{"HTTP/1.1 200 OK\r\nContent-Length: 9\r\n\r\nfour"}, "four", "5 bytes remaining"},
    {{"HTTP/1.1 200 OK\r\nContent-Length: 9\r\n\r\nfour", {}, true}, "four", "transfer: "},
    {{"HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\n9\r\nfour"}, "four", "outstanding"},
    {{""}, "", "Empty reply"},
    {{"HTTP/1.1 200 OK\r\nX: ", QByteArray(9999, 'x')}, "", "Out of memory"},
    {{"HTTP/1.1 200 OK\r\n", QByteArray(99, 'x') + ": y\r\n"}, "", "Too large"},
};

TEST_F(Client, FailsWhereATransferBreaksOffAndKeepsWhatArrived)
{
    for (const ServerFault& fault : kServerFaults) {
        const LogCapture log;
        const ScriptedServer faulty([&](const QByteArray&) { return fault.reply; });
        EXPECT_EQ(client.readBytes(faulty.url("x"), status), fault.body);
        EXPECT_TRUE(status.failed) << fault.reason;
        EXPECT_EQ(log.count(fault.reason), 1) << fault.reason << testing::PrintToString(log.lines());
    }
    client.readBytes("http://127.0.0.1:1/x", status);
    EXPECT_THAT(status.reason(), HasSubstr("Failed to connect"));
}

QByteArray redirectTo(const std::string& url)
{
    return "HTTP/1.1 302 Found\r\nContent-Length: 4\r\nLocation: " + QByteArray::fromStdString(url) +
           "\r\n\r\npage";
}

TEST_F(Client, FailsWhereHeadersAreLongerThanAnyServerNeeds)
{
    const struct
    {
        int lines;
        int length;
        bool isTaken;
    } kHeaders[] = {{1, 90'000, true}, {1, 110'000, false}, {3, 90'000, true}, {4, 90'000, false}};
    for (const auto& each : kHeaders) {
        const LogCapture log;
        const QByteArray line = "X-Long: " + QByteArray(each.length, 'x') + "\r\n";
        const ScriptedServer talkative([&](const QByteArray&) {
            return ScriptedServer::Reply{"HTTP/1.1 200 OK\r\nContent-Length: 2\r\n" +
                                         line.repeated(each.lines) + "\r\nok"};
        });
        client.readBytes(talkative.url("x"), status);
        EXPECT_EQ(status.failed, !each.isTaken) << each.lines << " of " << each.length << status.reason();
    }
}

TEST_F(Client, FollowsRedirectsAndTellsOthersNothing)
{
    ScriptedServer first([this](const QByteArray& request) -> ScriptedServer::Reply {
        return {redirectTo(request.startsWith("GET /a?") ? "/b?x=1" : server.url("c"))};
    });
    client.setSessionID("12");
    KxCurlDownloadStream stream = client.readFollowing(first.url("a"), 1);
    EXPECT_EQ(first.requests().size(), 2U);
    EXPECT_THAT(first.requests().at(1).toStdString(), StartsWith("GET /b?x=1&s=12 HTTP"));
    EXPECT_THAT(lastRequest(), StartsWith("GET /c HTTP/1.1\r\n"));
    EXPECT_THAT(lastRequest(), HasSubstr("\r\nRange: bytes=1-\r\n"));
    EXPECT_EQ(stream.httpStatus().failure, "The server sends the whole object where a range was asked for");
    EXPECT_EQ(client.readFollowing(first.url("a")).httpStatus().code, 200);
}

TEST_F(Client, FollowsNoRedirectThatLeadsAstray)
{
    const NginxServer secure(NginxServer::Scheme::Https, "location / { return 302 http://127.0.0.1:1/; }");
    std::string target;
    ScriptedServer endless([&](const QByteArray&) -> ScriptedServer::Reply { return {redirectTo(target)}; });
    const LogCapture log;
    const auto failure = [&](const std::string& url) { return client.readFollowing(url).failure(); };
    EXPECT_EQ(failure(secure.url("")), "The server redirects from HTTPS to \"http://127.0.0.1:1/\"");
    target = "file:///etc/passwd";
    EXPECT_THAT(failure(endless.url("")), HasSubstr("\"file:///etc/passwd\", which is no address of HTTP"));
    target = "/again";
    const std::size_t before = endless.requests().size();
    EXPECT_EQ(failure(endless.url("")), "The server redirects more than 5 times");
    EXPECT_EQ(endless.requests().size() - before, 6U);
}

TEST_F(Client, GivesEachThreadItsOwnAnswerAndNeedsNoMoreConnectionsThanThreads)
{
    constexpr int kThreads = 6;
    const NginxServer nginx(NginxServer::Scheme::Http, "location / { return 200 $uri/$connection; }");
    std::mutex mutex;
    std::set<QByteArray> connections;
    onThreads(kThreads, [&](int thread) {
        for (int round = 0; round < 30; ++round) {
            KxHttpStatus own;
            const QList<QByteArray> answer =
                client.readBytes(nginx.url(std::to_string(thread)), own).split('/');
            EXPECT_EQ(answer.value(1), QByteArray::number(thread));
            const std::lock_guard lock(mutex);
            connections.insert(answer.value(2));
        }
    });
    EXPECT_LE(connections.size(), std::size_t(kThreads));
}

}  // namespace
