#include "server/http/Client.h"
#include "server/http/RunningServer.h"
#include "support/Process.h"

#include <gtest/gtest.h>
#include <sys/resource.h>

#include <algorithm>

using namespace Kdd;

namespace
{

Http::Response pathAsText(const Http::Request& request)
{
    return Http::textResponse(200, "text/plain", request.path.value(0));
}

TEST(HttpLimits, AreToldToWhoeverGoesBeyondThem)
{
    const QByteArray start = "GET / HTTP/1.1\r\nHost: localhost\r\n";
    const std::pair<QByteArray, int> kRequests[] = {
        {"nonsense\r\n\r\n", 400},
        {"GET / HTTP/1.1\r\n\r\n", 400},
        {start + "Host: elsewhere\r\n\r\n", 400},
        {"GET / HTTP/1.1\r\nHost: localhost/a\r\n\r\n", 400},
        {"GET http://a@localhost/ HTTP/1.1\r\nHost: localhost\r\n\r\n", 400},
        {"GET /a/%2e%2e/b HTTP/1.1\r\nHost: localhost\r\n\r\n", 400},
        {start + "Content-Length: 1\r\nTransfer-Encoding: chunked\r\n\r\n", 400},
        {start + "Transfer-Encoding: chunked[\r\n\r\n0\r\n\r\n", 400},
        {start + "Transfer-Encoding: gzip, chunked\r\n\r\n0\r\n\r\n", 400},
        {start + "Content-Length: -1\r\n\r\n", 400},
        {start + "a b: c\r\n\r\n", 400},
        {start + "a: " + QByteArray(40'000, 'x') + "\r\n\r\n", 431},
        {"GET /" + QByteArray(40'000, 'x'), 431},
        {start + "Content-Length: 99999999999\r\n\r\n", 413},
        {start + "Transfer-Encoding: chunked\r\n\r\n11170\r\n" + QByteArray(70'000, 'x'), 413},
        {"GET / HTTP/2.0\r\n\r\n", 505},
    };
    RunningServer server(pathAsText);
    for (const auto& [request, status] : kRequests) {
        Client client(server.address());
        client.send(request);
        const Reply reply = client.reply();
        EXPECT_EQ(reply.status, status) << request.left(60).constData();
        EXPECT_EQ(reply.header("Connection"), "close");
        EXPECT_TRUE(reply.isWhole && !reply.body.isEmpty());
        EXPECT_EQ(client.rest(), "");
    }
}

TEST(HttpLimits, LetABodyOfAGetPassUnread)
{
    RunningServer server(pathAsText);
    Client client(server.address());
    client.get("/a", "Content-Length: 5\r\nExpect: 100-continue\r\n");
    EXPECT_EQ(client.reply(Client::Body::StaysBehind).status, 100);
    client.send("12345");
    EXPECT_EQ(client.reply().body, "a");
    client.get("/b", "Content-Length: 3\r\n");
    client.send("GETGET /c HTTP/1.1\r\nHost: localhost\r\n\r\n");
    EXPECT_EQ(client.reply().body, "b");
    EXPECT_EQ(client.reply().body, "c");
}

TEST(HttpLimits, EndWhatDoesNotComeInTime)
{
    Http::HttpSettings impatient;
    impatient.patience = impatient.idle = std::chrono::milliseconds(1000);
    RunningServer server(pathAsText, impatient);
    Client silent(server.address());
    Client slow(server.address());
    slow.send("GET / HTTP/1.1\r\nHost: loc");
    Client half(server.address());
    half.send("POST / HTTP/1.1\r\nHost: localhost\r\nContent-Length: 10\r\n\r\nhalf");
    EXPECT_EQ(slow.reply().status, 408);
    EXPECT_EQ(half.reply().status, 408);
    EXPECT_EQ(slow.rest(), "");
    EXPECT_EQ(silent.rest(), "") << "who asked for nothing is told nothing";
    Client kept(server.address());
    EXPECT_EQ(kept.ask("/a").body, "a");
    EXPECT_EQ(kept.rest(), "");
}

TEST(HttpLimits, TellThatThereAreTooManyConnections)
{
    RunningServer server(pathAsText, with(&Http::HttpSettings::connections, 1));
    Client first(server.address());
    EXPECT_EQ(first.ask("/a").body, "a");
    Client second(server.address());
    const Reply reply = second.reply();
    EXPECT_EQ(reply.status, 503);
    EXPECT_EQ(reply.header("Retry-After"), "1");
    EXPECT_EQ(second.rest(), "");
    EXPECT_EQ(first.ask("/b").body, "b");
}

TEST(HttpLimits, TellThatThereAreTooManyRequests)
{
    Gate gate;
    RunningServer server(
        [&](const Http::Request& request) {
            gate.pass();
            return pathAsText(request);
        },
        with(&Http::HttpSettings::requests, 1));
    Client first(server.address());
    first.get("/a");
    gate.awaitThread();
    Client second(server.address());
    const Reply refused = second.ask("/b");
    EXPECT_EQ(refused.status, 503);
    EXPECT_EQ(refused.header("Retry-After"), "1");
    gate.open();
    EXPECT_EQ(first.reply().body, "a");
    EXPECT_EQ(second.ask("/b").body, "b") << "the connection stays";
}

TEST(HttpLimits, LetTenThousandConnectionsRest)
{
    constexpr int kConnections = 10'000;
    rlimit limit = {};
    ::getrlimit(RLIMIT_NOFILE, &limit);
    limit.rlim_cur = limit.rlim_max;
    ::setrlimit(RLIMIT_NOFILE, &limit);
    if (limit.rlim_max < kConnections + 300)
        GTEST_SKIP() << "a process has " << limit.rlim_max << " descriptors here";
    RunningServer server(pathAsText, with(&Http::HttpSettings::connections, kConnections + 1));
    // The clients have descriptors of their own.
    const bool isServed = inChild([&] {
        std::vector<std::unique_ptr<Client>> clients;
        for (int i = 0; i < kConnections; ++i)
            clients.push_back(std::make_unique<Client>(server.address()));
        const bool allConnected = std::all_of(clients.begin(), clients.end(),
                                              [](const auto& client) { return client->isConnected(); });
        Client one(server.address());
        one.get("/a");
        clients.back()->get("/b");
        return allConnected && one.reply().body == "a" && clients.back()->reply().body == "b";
    });
    EXPECT_TRUE(isServed);
}

}  // namespace
