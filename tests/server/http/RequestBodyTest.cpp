#include "server/http/Client.h"
#include "server/http/RunningServer.h"

#include <gtest/gtest.h>

using namespace Kdd;

namespace
{

/// What sinks are told, by all of them.
struct Seen
{
    std::mutex mutex;
    std::condition_variable changed;
    int ended = 0;
    qint64 bytes = 0;

    void awaitEnd()
    {
        std::unique_lock<std::mutex> lock(mutex);
        changed.wait(lock, [this] { return ended > 0; });
    }
};

/// Keeps what comes, up to a bound, and answers with it.
class Keeper : public Http::BodySink
{
public:
    Keeper(Seen& seen, int most)
        : mSeen(seen)
        , mMost(most)
    {
    }
    ~Keeper() override
    {
        const std::lock_guard<std::mutex> lock(mSeen.mutex);
        ++mSeen.ended;
        mSeen.changed.notify_all();
    }

    bool take(const char* bytes, int size) override
    {
        mBody.append(bytes, size);
        const std::lock_guard<std::mutex> lock(mSeen.mutex);
        mSeen.bytes += size;
        return mBody.size() <= mMost;
    }
    Http::Response answer() override
    {
        return mBody.size() <= mMost ? Http::textResponse(200, "text/plain", mBody)
                                     : Http::failure(413, QStringLiteral("enough"));
    }

private:
    Seen& mSeen;
    int mMost;
    QByteArray mBody;
};

class RequestBody : public testing::Test
{
protected:
    explicit RequestBody(int patience = 20000)
    {
        mServer = std::make_unique<RunningServer>(
            [this](const Http::Request& request) { return answer(request); },
            with(&Http::HttpSettings::patience, std::chrono::milliseconds(patience)));
    }

    Http::Response answer(const Http::Request& request)
    {
        if (request.path.value(0) != "keep")
            return Http::failure(404, QStringLiteral("nowhere"));
        Http::Response response;
        response.addHeader("X-Early", "yes");
        response.sink = std::make_unique<Keeper>(mSeen, 300000);
        return response;
    }

    static QByteArray post(const QByteArray& path, const QByteArray& headers)
    {
        return "POST " + path + " HTTP/1.1\r\nHost: localhost\r\n" + headers + "\r\n";
    }

    Seen mSeen;
    std::unique_ptr<RunningServer> mServer;
};

class ImpatientBody : public RequestBody
{
protected:
    ImpatientBody()
        : RequestBody(500)
    {
    }
};

TEST_F(RequestBody, IsTakenHoweverItIsSent)
{
    Client client(mServer->address());
    const QByteArray body = QByteArray("0123456789abcdef").repeated(16000);  // more than one block
    client.send(post("/keep", "Content-Length: " + QByteArray::number(body.size()) + "\r\n") + body);
    const Reply sized = client.reply();
    EXPECT_EQ(sized.body, body);
    EXPECT_EQ(sized.header("X-Early"), "yes");
    client.send(post("/keep", "Transfer-Encoding: chunked\r\n") + "3\r\nabc\r\n");
    client.send("4;x=y\r\ndefg\r\n0\r\nTrailer: 1\r\n\r\n" + post("/keep", "Content-Length: 0\r\n"));
    EXPECT_EQ(client.reply().body, "abcdefg");
    const Reply empty = client.reply();
    EXPECT_EQ(empty.status, 200) << "one that came with the former";
    EXPECT_EQ(empty.body, "");
    client.send(post("/keep", "Transfer-Encoding: chunked\r\n") + "0\r\nX-Request-Id: behind\r\n\r\n");
    const Reply trailed = client.reply();
    EXPECT_EQ(trailed.status, 200);
    EXPECT_NE(trailed.header("X-Request-Id"), "behind") << "no field of the header";
}

TEST_F(RequestBody, WaitsForLeaveAndGetsItOnlyWhereItIsWanted)
{
    Client client(mServer->address());
    client.send(post("/keep", "Content-Length: 3\r\nExpect: 100-continue\r\n"));
    EXPECT_EQ(client.reply(Client::Body::StaysBehind).status, 100);
    client.send("abc");
    EXPECT_EQ(client.reply().body, "abc");
    client.send(post("/other", "Content-Length: 300000\r\nExpect: 100-continue\r\n"));
    EXPECT_EQ(client.reply().status, 404) << "without having been asked to send it";
    EXPECT_EQ(client.rest(), "");
}

TEST_F(RequestBody, IsAnsweredBeforeItsEndWhereNoMoreIsWanted)
{
    for (const char* path : {"/keep", "/other"}) {
        Client client(mServer->address());
        client.send(post(path, "Content-Length: 30000000\r\n"));
        // The client reads nothing before it has sent all, as browsers do.
        for (int i = 0; i < 300; ++i)
            client.send(QByteArray(100000, 'x'));
        EXPECT_EQ(client.reply().status, *(path + 1) == 'k' ? 413 : 404);
        EXPECT_EQ(client.rest(), "");
    }
    EXPECT_LT(mSeen.bytes, 1000000);
}

TEST_F(RequestBody, ThatBreaksOffIsNotAnswered)
{
    {
        Client client(mServer->address());
        client.send(post("/keep", "Content-Length: 10\r\n") + "abc");
    }
    mSeen.awaitEnd();
    EXPECT_FALSE(mServer->exchanges(1)[0].isWhole);
    Client client(mServer->address());
    client.send(post("/keep", "Transfer-Encoding: chunked\r\n") + "nonsense\r\n");
    EXPECT_EQ(client.reply().status, 400);
    EXPECT_EQ(client.rest(), "");
}

TEST_F(ImpatientBody, IsNotWaitedForLongerThanTheServerMayWait)
{
    Client client(mServer->address());
    client.send(post("/keep", "Content-Length: 10\r\n") + "abc");
    EXPECT_EQ(client.reply().status, 408);
    EXPECT_EQ(client.rest(), "");
    mSeen.awaitEnd();
}

}  // namespace
