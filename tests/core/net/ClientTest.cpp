#include "kddlib/net/KxCurlClient.h"
#include "kddlib/net/cloud/KxCurlUploadStream.h"
#include "kddlib/net/http/CurlError.h"
#include "kddlib/net/http/CurlShare.h"
#include "kddlib/net/http/KxCurlDownloadStream.h"
#include "kddlib/net/http/KxCurlRequest.h"
#include "support/HttpServer.h"
#include "support/LogCapture.h"

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
    ~Client() override
    {
        client.setSessionID({});
        qunsetenv("KDD_CLOUD_API");
    }

    std::string lastRequest() const { return server.requests().back().toStdString(); }

    KxCurlClient& client = KxCurlClient::instance();
    KxHttpStatus status;
    ScriptedServer server{[](const QByteArray&) -> ScriptedServer::Reply {
        return {
            "HTTP/1.1 103 Early Hints\r\n\r\nHTTP/1.1 200 OK\r\nX-Two:  b \r\nX-TWO:c: d\r\n\r\n{\"a\": 1}"};
    }};
};

TEST_F(Client, ReadsABodyOfAnyLengthAndKeepsTheConnection)
{
    NginxServer nginx(NginxServer::Scheme::Http, "location = /connection { return 200 $connection; }"
                                                 "location /chunked/ { alias files/; ssi on; ssi_types *; }");
    const QByteArray big(3'000'001, 'x');
    nginx.addFile("big", big);
    const QByteArray connection = client.readBytes(nginx.url("connection"), status);
    EXPECT_EQ(client.readBytes(nginx.url("big"), status), big);
    EXPECT_TRUE(status.ok());
    EXPECT_EQ(status.bytesReceived, quint64(big.size()));
    EXPECT_EQ(status.headers.at("content-length"), "3000001");
    EXPECT_EQ(client.readBytes(nginx.url("chunked/big"), status), big);
    EXPECT_EQ(status.headers.at("transfer-encoding"), "chunked");
    EXPECT_EQ(client.readBytes(nginx.url("connection"), status), connection);
    EXPECT_THAT(client.readBytes(nginx.url("absent"), status).toStdString(), HasSubstr("404 Not Found"));
    EXPECT_EQ(status.code, 404);
    EXPECT_FALSE(status.ok() || status.failed);
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
    client.postBytes(server.url("p"), {}, status);
    EXPECT_THAT(lastRequest(), StartsWith("POST /p HTTP/1.1\r\n"));
    EXPECT_THAT(lastRequest(),
                HasSubstr("\r\nContent-Type: application/octet-stream\r\nContent-Length: 0\r\n"));
    client.postJson(server.url("p"), {{QStringLiteral("k"), 2}}, status);
    EXPECT_THAT(lastRequest(), HasSubstr("\r\nContent-Type: application/json\r\n"));
    EXPECT_THAT(lastRequest(), EndsWith("\r\n\r\n{\n    \"k\": 2\n}\n"));
}

TEST_F(Client, RefusesAHeaderLineThatWouldBeTwo)
{
    EXPECT_THROW(client.postBytes(server.url("p"), "b", "a\r\nX-Admin: 1", status), std::runtime_error);
    EXPECT_TRUE(server.requests().empty());
}

TEST_F(Client, DeletesCloudObjectsAndNothingElse)
{
    const LogCapture log;  // of the missing credentials
    qputenv("KDD_CLOUD_API", server.url("").c_str());
    client.setSessionID("12");
    EXPECT_TRUE(client.deleteObject(server.url("x")));
    EXPECT_TRUE(server.requests().empty());
    EXPECT_TRUE(client.deleteObject("gs://b/x/y"));
    EXPECT_THAT(lastRequest(), StartsWith("DELETE /b/x%2Fy HTTP/1.1\r\nHost: 127.0.0.1:"));
    EXPECT_THAT(lastRequest(), HasSubstr("\r\nCache-Control: no-transform\r\n"));
    EXPECT_THAT(lastRequest(), HasSubstr("\r\nUser-Agent: Korvex kddlib "));
    qputenv("KDD_CLOUD_API", "http://127.0.0.1:1/");
    EXPECT_THROW(client.deleteObject("gs://b/x"), CurlError);
}

TEST_F(Client, SendsNothingToAnAddressThatIsNoObjectsOwn)
{
    const LogCapture log;
    qputenv("KDD_CLOUD_API", server.url("").c_str());
    qputenv("KDD_CLOUD_UPLOAD", server.url("").c_str());
    for (const char* address : {"gs://b/o?generation=5", "gs://b", "gs://b/..", "gs://b/5%", "gs://b#/o"}) {
        EXPECT_THROW(client.deleteObject(address), std::invalid_argument) << address;
        EXPECT_THROW(client.write(address), std::invalid_argument) << address;
    }
    EXPECT_TRUE(server.requests().empty());
    EXPECT_TRUE(client.deleteObject("gs://b/scan#1 a.dcm"));
    EXPECT_THAT(lastRequest(), StartsWith("DELETE /b/scan%231%20a.dcm HTTP/1.1\r\n"));
    qunsetenv("KDD_CLOUD_UPLOAD");
    EXPECT_THROW(client.readBytes(server.url(std::string("a\0b", 3)), status), CurlError);
    client.readBytes(server.url("a/../b"), status);
    EXPECT_THAT(lastRequest(), StartsWith("GET /a/../b HTTP/1.1\r\n"));
}

TEST_F(Client, TellsWhyATransferFailed)
{
    const LogCapture log;
    client.readBytes("http://127.0.0.1:1/x", status);
    EXPECT_TRUE(status.failed);
    EXPECT_THAT(status.failure, HasSubstr("Failed to connect"));
}

QByteArray redirectTo(const std::string& url)
{
    return "HTTP/1.1 302 Found\r\nContent-Length: 4\r\nLocation: " + QByteArray::fromStdString(url) +
           "\r\n\r\npage";
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

class ManyThreads : public testing::TestWithParam<CurlShare::Connections>
{
};

TEST_P(ManyThreads, GetEachItsOwnAnswer)
{
    const NginxServer nginx(NginxServer::Scheme::Http, "location / { return 200 $uri; }");
    const CurlShare share(GetParam());
    const auto factory = std::make_shared<KxCurlHandleFactory>(4);  // too few to keep all handles
    std::vector<std::thread> threads;
    for (int i = 0; i < 8; ++i)
        threads.emplace_back([&, path = "/" + std::to_string(i)] {
            for (int round = 0; round < 25; ++round) {
                KxCurlRequest request(factory, share, nginx.url(path.substr(1)), "GET");
                request.perform();
                EXPECT_EQ(request.response().toStdString(), path);
            }
        });
    for (std::thread& thread : threads)
        thread.join();
}

TEST_F(Client, NeedsNoMoreConnectionsThanThreads)
{
    constexpr int kThreads = 6;
    const NginxServer nginx(NginxServer::Scheme::Http, "location / { return 200 $connection; }");
    std::mutex mutex;
    std::set<QByteArray> connections;
    std::vector<std::thread> threads;
    for (int i = 0; i < kThreads; ++i)
        threads.emplace_back([&] {
            for (int round = 0; round < 30; ++round) {
                KxHttpStatus own;
                const QByteArray connection = client.readBytes(nginx.url("x"), own);
                const std::lock_guard lock(mutex);
                connections.insert(connection);
            }
        });
    for (std::thread& thread : threads)
        thread.join();
    EXPECT_LE(connections.size(), std::size_t(kThreads));
}

TEST_F(Client, DeletesOverOneConnection)
{
    const LogCapture log;
    const NginxServer nginx(NginxServer::Scheme::Http, "location = /accepted { stub_status; }"
                                                       "location /b/ { return 204; }");
    qputenv("KDD_CLOUD_API", nginx.url("").c_str());
    const auto accepted = [&] {
        return client.readBytes(nginx.url("accepted"), status).split('\n').value(2);
    };
    const QByteArray before = accepted();
    for (int i = 0; i < 5; ++i)
        EXPECT_TRUE(client.deleteObject("gs://b/x"));
    EXPECT_EQ(accepted().trimmed().split(' ').first().toInt(),
              before.trimmed().split(' ').first().toInt() + 1);
}

INSTANTIATE_TEST_SUITE_P(Net, ManyThreads,
                         testing::Values(CurlShare::Connections::Shared, CurlShare::Connections::PerHandle));

}  // namespace
