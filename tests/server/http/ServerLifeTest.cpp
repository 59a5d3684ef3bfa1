#include "server/http/Client.h"
#include "server/http/RunningServer.h"
#include "support/LogCapture.h"

#include <gtest/gtest.h>

#include <set>
#include <thread>

using namespace Kdd;

namespace
{

Http::Response targetAsText(const Http::Request& request)
{
    return Http::textResponse(200, "text/plain", request.target);
}

TEST(HttpServer, AnswersRequestsThatComeAtOnceInTheirOrder)
{
    RunningServer server(targetAsText);
    Client client(server.address());
    QByteArray requests;
    for (int i = 0; i < 200; ++i)
        requests += "GET /" + QByteArray::number(i) + " HTTP/1.1\r\nHost: localhost\r\n\r\n\r\n";
    client.send(requests);
    for (int i = 0; i < 200; ++i)
        EXPECT_EQ(client.reply().body, '/' + QByteArray::number(i));
}

TEST(HttpServer, ReadsARequestThatComesByteByByte)
{
    RunningServer server(targetAsText);
    Client client(server.address());
    for (const char letter : QByteArray("GET /a?b=c HTTP/1.1\r\nHost: localhost\r\n\r\n"))
        client.send(QByteArray(1, letter));
    EXPECT_EQ(client.reply().body, "/a?b=c");
}

TEST(HttpServer, NamesEachRequest)
{
    RunningServer server([](const Http::Request& request) {
        return Http::textResponse(200, "text/plain", request.id + ' ' + request.peer + ' ' + request.base);
    });
    Client client(server.address());
    const QByteArray tail = " 127.0.0.1 http://localhost";
    std::set<QByteArray> ids;
    for (const QByteArray given : {"", "a b", "<script>"}) {
        const Reply reply =
            client.ask("/", given.isEmpty() ? QByteArray() : "X-Request-Id: " + given + "\r\n");
        const QByteArray id = reply.header("X-Request-Id");
        EXPECT_TRUE(ids.insert(id).second && !id.isEmpty() && id != given);
        EXPECT_EQ(reply.body, id + tail);
    }
    EXPECT_EQ(client.ask("/", "X-Request-Id: Viewer-1.2_3\r\n").body, "Viewer-1.2_3" + tail);
}

TEST(HttpServer, AnswersFiveHundredWhereAHandlerThrows)
{
    LogCapture log;
    RunningServer server(
        [](const Http::Request&) -> Http::Response { throw std::runtime_error("secret path"); });
    Client client(server.address());
    const Reply reply = client.ask("/");
    EXPECT_EQ(reply.status, 500);
    EXPECT_FALSE(reply.body.contains("secret"));
    EXPECT_EQ(server.exchanges(1)[0].status, 500);
    EXPECT_EQ(log.count("secret path"), 1);
}

TEST(HttpServer, AnswersWhatIsInFlightWhenItStops)
{
    Gate gate;
    RunningServer server([&](const Http::Request& request) {
        if (request.path.value(0) == "wait")
            gate.pass();
        return targetAsText(request);
    });
    Client resting(server.address());
    EXPECT_EQ(resting.ask("/a").body, "/a");
    Client half(server.address());
    half.send("GET /b HT");
    Client waiting(server.address());
    waiting.get("/wait");
    gate.awaitThread();
    std::thread stopping([&] { server.http().stop(); });
    EXPECT_EQ(resting.rest(), "");
    EXPECT_EQ(half.rest(), "");
    EXPECT_FALSE(Client(server.address()).isConnected());
    gate.open();
    const Reply reply = waiting.reply();
    EXPECT_EQ(reply.body, "/wait");
    EXPECT_EQ(reply.header("Connection"), "close");
    stopping.join();
    EXPECT_EQ(server.http().connections(), 0);
    EXPECT_EQ(server.http().requestsInFlight(), 0);
}

class Endless : public Http::Producer
{
public:
    Result next(QByteArray& block) override
    {
        block = QByteArray(65536, 'x');
        return {};
    }
};

TEST(HttpServer, StopsWithoutThoseWhoTakeTooLong)
{
    RunningServer server([](const Http::Request&) { return answerOf(std::make_unique<Endless>()); },
                         with(&Http::HttpSettings::stop, std::chrono::milliseconds(50)));
    Client client(server.address(), Client::Tls::No, 4096);
    client.get("/");
    EXPECT_EQ(client.reply(Client::Body::StaysBehind).status, 200);
    server.http().stop();
    EXPECT_FALSE(server.exchanges(1)[0].isWhole);
}

TEST(HttpServer, SaysWhyItCannotBegin)
{
    const TlsFiles tls;
    const TlsFiles other;
    RunningServer taken(targetAsText);
    Http::ListenAddress address;
    ASSERT_TRUE(Http::ListenAddress::parse(taken.address().mid(7), address));
    const std::tuple<Http::ListenAddress, QByteArray, QByteArray, QByteArray> kFaults[] = {
        {address, {}, {}, address.text()},
        {{"127.0.0.1", 0}, "/nowhere.pem", tls.key(), "/nowhere.pem"},
        {{"127.0.0.1", 0}, tls.certificate(), "/nowhere.pem", "/nowhere.pem"},
        {{"127.0.0.1", 0}, tls.certificate(), other.key(), other.key()},
    };
    struct Nobody : Http::Handler, Http::ExchangeObserver
    {
        Http::Response answer(const Http::Request&) override { return Http::Response(204); }
        void ended(const Http::Exchange&) override {}
    } nobody;
    for (const auto& [at, certificate, key, named] : kFaults) {
        Http::HttpSettings settings;
        settings.address = at;
        settings.certificateFile = certificate;
        settings.keyFile = key;
        Http::HttpServer server(settings, nobody, nobody);
        const std::string reason = server.start().text().toStdString();
        EXPECT_NE(reason.find(named.toStdString()), std::string::npos) << reason;
    }
}

TEST(ListenAddress, IsReadAndSaysWhoReachesIt)
{
    const std::tuple<const char*, const char*, bool> kAddresses[] = {
        {"127.0.0.1:8042", "127.0.0.1:8042", true}, {"127.1.2.3:1", "127.1.2.3:1", true},
        {"localhost:0", "127.0.0.1:0", true},       {"[::1]:65535", "[::1]:65535", true},
        {"0.0.0.0:80", "0.0.0.0:80", false},        {"[::]:80", "[::]:80", false},
        {"10.0.0.1:80", "10.0.0.1:80", false},      {"[::ffff:10.0.0.1]:80", "[::ffff:10.0.0.1]:80", false},
    };
    Http::ListenAddress address;
    for (const auto& [given, shown, isLoopback] : kAddresses) {
        EXPECT_TRUE(Http::ListenAddress::parse(given, address)) << given;
        EXPECT_EQ(address.text(), shown);
        EXPECT_EQ(address.isLoopback(), isLoopback) << given;
    }
    for (const char* text :
         {"", "8042", ":8042", "127.0.0.1", "127.0.0.1:", "127.0.0.1:65536", "127.0.0.1:-1", "::1:80",
          "[127.0.0.1]:80", "[::1]", "127.1:80", "host:80", "127.0.0.1 :80"})
        EXPECT_FALSE(Http::ListenAddress::parse(text, address)) << text;
}

}  // namespace
