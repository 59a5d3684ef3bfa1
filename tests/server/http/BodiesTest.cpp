#include "server/http/Client.h"
#include "server/http/RunningServer.h"
#include "support/BytesRead.h"
#include "support/FileContent.h"

#include <unistd.h>

#include <atomic>

using namespace Kdd;

namespace
{

/// Bytes that tell where they stand.
QByteArray numbered(int size)
{
    QByteArray bytes;
    bytes.reserve(size + 8);
    for (int i = 0; bytes.size() < size; i += 8)
        bytes += QByteArray::number(i, 16).rightJustified(8, '.');
    return bytes.left(size);
}

/// Blocks of 64 KiB that are counted.
class Blocks : public Http::Producer
{
public:
    Blocks(int count, std::atomic<int>* made = nullptr)
        : mLeft(count)
        , mMade(made)
    {
    }

    Result next(QByteArray& block) override
    {
        if (mLeft < 0)
            return Result::failure(QStringLiteral("there is no more"));
        block = mLeft > 0 ? QByteArray(65536, static_cast<char>('a' + mLeft % 26)) : QByteArray();
        --mLeft;
        if (mMade != nullptr)
            ++*mMade;
        return {};
    }

    static QByteArray all(int count)
    {
        QByteArray bytes;
        for (int left = count; left > 0; --left)
            bytes += QByteArray(65536, static_cast<char>('a' + left % 26));
        return bytes;
    }

private:
    int mLeft;
    std::atomic<int>* mMade;
};

class HttpBodies : public FileTest
{
protected:
    std::shared_ptr<const Http::OpenFile> aFile(const QByteArray& content)
    {
        putFile(path(), content);
        Result result;
        return Http::OpenFile::open(path().toLocal8Bit(), result);
    }
};

TEST_F(HttpBodies, ConsistOfBytesRangesAndBlocksInTheirOrder)
{
    const QByteArray content = numbered(300'001);
    const auto file = aFile(content);
    const auto answer = [&](const Http::Request& request) {
        Http::Response response = answerOf(QByteArray("--first\r\n"));
        response.body.emplace_back(Http::FileRange{file, 7, 200'001});
        response.body.emplace_back(Http::FileRange{file, 300'001, 0});
        response.body.emplace_back(QByteArray(100'000, '-'));
        response.body.emplace_back(Http::FileRange{file, 300'000, 1});
        if (request.path.value(0) == "blocks")
            response.body.emplace_back(std::make_unique<Blocks>(3));
        response.body.emplace_back(QByteArray());
        return response;
    };
    const QByteArray parts =
        "--first\r\n" + content.mid(7, 200'001) + QByteArray(100'000, '-') + content.mid(300'000);
    const TlsFiles tls;
    Http::HttpSettings secure;
    secure.certificateFile = tls.certificate();
    secure.keyFile = tls.key();
    RunningServer plain(answer);
    RunningServer encrypted(answer, secure);
    EXPECT_TRUE(encrypted.address().startsWith("https://"));
    Client clients[] = {Client(plain.address()), Client(encrypted.address(), Client::Tls::Yes)};
    for (Client& client : clients) {
        const Reply known = client.ask("/known");
        EXPECT_EQ(known.header("Content-Length"), QByteArray::number(parts.size()));
        EXPECT_TRUE(known.isWhole && known.body == parts);
        const Reply blocks = client.ask("/blocks");
        EXPECT_EQ(blocks.header("Content-Length"), "");
        EXPECT_TRUE(blocks.isWhole && blocks.body == parts + Blocks::all(3));
        client.send("GET /blocks HTTP/1.0\r\nHost: localhost\r\nConnection: keep-alive\r\n\r\n");
        const Reply old = client.reply();
        EXPECT_EQ(old.header("Transfer-Encoding"), "");
        EXPECT_TRUE(old.body == parts + Blocks::all(3));
    }
}

TEST_F(HttpBodies, StayBehindForHeadAndWhereThereIsNone)
{
    RunningServer server([](const Http::Request& request) {
        Http::Response response = Http::textResponse(request.path.value(0).toInt(), "text/plain", "text");
        response.addHeader("ETag", "\"x\"");
        return response;
    });
    Client client(server.address());
    client.send("HEAD /200 HTTP/1.1\r\nHost: localhost\r\n\r\n"
                "GET /304 HTTP/1.1\r\nHost: localhost\r\n\r\n"
                "GET /204 HTTP/1.1\r\nHost: localhost\r\n\r\n"
                "GET /200 HTTP/1.1\r\nHost: localhost\r\nConnection: close\r\n\r\n");
    EXPECT_EQ(client.reply(Client::Body::StaysBehind).header("Content-Length"), "4");
    for (const int status : {304, 204}) {
        const Reply reply = client.reply();
        EXPECT_EQ(reply.status, status);
        EXPECT_EQ(reply.header("Content-Length"), "");
        EXPECT_EQ(reply.header("ETag"), "\"x\"");
    }
    const Reply last = client.reply();
    EXPECT_EQ(last.body, "text");
    EXPECT_EQ(last.header("Connection"), "close");
    EXPECT_EQ(client.rest(), "");
}

TEST_F(HttpBodies, OfAFileThatIsCutEndEarlyWithoutOtherBytes)
{
    constexpr int kSize = 48 * 1024 * 1024;
    const QByteArray content = numbered(kSize);
    const auto file = aFile(content);
    RunningServer server([&](const Http::Request&) { return answerOf(Http::FileRange{file, 0, kSize}); });
    Client client(server.address(), Client::Tls::No, 65536);
    client.get("/");
    // As soon as the client has the head, the system holds the first megabytes and the rest is still in the file.
    EXPECT_EQ(client.reply(Client::Body::StaysBehind).status, 200);
    ASSERT_EQ(::truncate(path().toLocal8Bit().constData(), 40 * 1024 * 1024), 0);
    const QByteArray body = client.rest();
    EXPECT_EQ(body.size(), 40 * 1024 * 1024);
    EXPECT_TRUE(body == content.left(body.size()));
    const std::vector<Http::Exchange> ended = server.exchanges(1);
    EXPECT_FALSE(ended[0].isWhole);
    EXPECT_EQ(ended[0].fault, QStringLiteral("the file was cut short"));
}

TEST_F(HttpBodies, ThatCannotBeMadeEndEarly)
{
    struct Throwing : Http::Producer
    {
        Result next(QByteArray&) override { throw std::runtime_error("there is no more"); }
    };
    RunningServer server([](const Http::Request& request) {
        Http::Response response = answerOf(std::make_unique<Blocks>(0));
        if (request.path.value(0) == "throw")
            response.body.emplace_back(std::make_unique<Throwing>());
        else
            response.body.emplace_back(std::make_unique<Blocks>(-1));
        return response;
    });
    std::size_t count = 0;
    for (const char* path : {"/fail", "/throw"}) {
        Client client(server.address());
        const Reply reply = client.ask(path);
        EXPECT_EQ(reply.status, 200);
        EXPECT_FALSE(reply.isWhole);
        EXPECT_EQ(server.exchanges(++count).back().fault, QStringLiteral("there is no more"));
    }
}

TEST_F(HttpBodies, AndHeadersThatCannotBeSentAreReplaced)
{
    const auto file = aFile("12345");
    RunningServer server([&](const Http::Request& request) {
        Http::Response response(200);
        const QByteArray what = request.path.value(0);
        if (what == "value")
            response.addHeader("Content-Disposition", "a\r\nSet-Cookie: b");
        else if (what == "name")
            response.addHeader("a b", "c");
        else
            response.body.emplace_back(Http::FileRange{file, 3, what.toInt()});
        return response;
    });
    Client client(server.address());
    for (const char* path : {"/value", "/name", "/3", "/-1"}) {
        const Reply reply = client.ask(path);
        EXPECT_EQ(reply.status, 500) << path;
        EXPECT_EQ(reply.header("Set-Cookie"), "");
    }
    EXPECT_EQ(client.ask("/2").body, "45");
}

TEST_F(HttpBodies, OfClientsThatDoNotReadTakeLittleMemoryAndHoldUpNobody)
{
    constexpr int kClients = 1000;
    constexpr int kBlocks = 1000;
    std::atomic<int> made = 0;
    RunningServer server(
        [&](const Http::Request& request) {
            return request.path.value(0) == "a" ? Http::textResponse(200, "text/plain", "a")
                                                : answerOf(std::make_unique<Blocks>(kBlocks, &made));
        },
        with(&Http::HttpSettings::requests, kClients));
    const qint64 before = residentMemory();
    std::vector<std::unique_ptr<Client>> clients;
    for (int i = 0; i < kClients; ++i) {
        clients.push_back(std::make_unique<Client>(server.address(), Client::Tls::No, 4096));
        clients.back()->get("/");
    }
    for (const auto& client : clients)
        EXPECT_EQ(client->reply(Client::Body::StaysBehind).status, 200);
    Client another(server.address());
    EXPECT_EQ(another.ask("/a").body, "a");
    EXPECT_LT(made, kClients * kBlocks / 2) << "blocks are made as clients take them";
    EXPECT_LT(residentMemory() - before, 200 * 1024) << "of 64 MiB for each client";
}

TEST_F(HttpBodies, OfAClientThatTakesNothingAreBrokenOff)
{
    RunningServer server([](const Http::Request&) { return answerOf(std::make_unique<Blocks>(1000)); },
                         with(&Http::HttpSettings::patience, std::chrono::milliseconds(1000)));
    Client client(server.address(), Client::Tls::No, 4096);
    client.get("/");
    const std::vector<Http::Exchange> ended = server.exchanges(1);
    EXPECT_FALSE(ended[0].isWhole);
    EXPECT_EQ(ended[0].fault, QString()) << "that is the client's doing";
    EXPECT_FALSE(client.reply().isWhole);
}

}  // namespace
