#include "server/Server.h"

#include "server/http/Client.h"
#include "support/LogCapture.h"
#include "support/TemporaryStore.h"

#include <QDir>

#include <gtest/gtest.h>
#include <kddlib/Catalogue.h>
#include <kddlib/Kxg.h>

using namespace Kdd;

namespace
{

class ServerTest : public testing::Test
{
protected:
    ServerTest()
    {
        mSettings.http.address = {"127.0.0.1", 0};
        mSettings.status = Http::ListenAddress{"127.0.0.1", 0};
    }

    std::unique_ptr<Server> started()
    {
        Result result;
        std::unique_ptr<Server> server = Server::make(mSettings, result);
        if (result.good())
            result = server->start();
        EXPECT_EQ(result.text(), QString());
        return server;
    }

    std::string refusal()
    {
        Result result;
        EXPECT_EQ(Server::make(mSettings, result), nullptr);
        return result.text().toStdString();
    }

    static Reply get(const QByteArray& address, const QByteArray& path, const QByteArray& headers = {})
    {
        Client client(address);
        client.get(path, headers);
        return client.reply();
    }

    TemporaryStore mStore;
    ServerSettings mSettings;
};

TEST_F(ServerTest, RefusesAddressesThatOtherMachinesReach)
{
    mSettings.http.address = {"0.0.0.0", 0};
    EXPECT_NE(refusal().find("0.0.0.0:0 can be reached by other machines"), std::string::npos);
    mSettings.http.address = {"127.0.0.1", 0};
    mSettings.status = Http::ListenAddress{"::", 0};
    EXPECT_NE(refusal().find("[::]:0 can be reached by other machines"), std::string::npos);
}

TEST_F(ServerTest, AnswersOnlyWhoNamesIt)
{
    const auto server = started();
    for (const QByteArray& address : {server->address(), server->statusAddress()}) {
        Client client(address);
        client.send("GET /healthz HTTP/1.1\r\nHost: evil.example\r\n\r\n");
        EXPECT_EQ(client.reply().status, 421);
        client.send("GET http://evil.example/healthz HTTP/1.1\r\nHost: localhost\r\n\r\n");
        EXPECT_EQ(client.reply().status, 421);
        client.send("GET /healthz HTTP/1.0\r\n\r\n");
        EXPECT_NE(client.reply().status, 421) << "no page can leave its name out";
    }
}

TEST_F(ServerTest, TellsWhetherItIsReady)
{
    const auto server = started();
    EXPECT_EQ(get(server->statusAddress(), "/healthz").body, "alive\n");
    Kxg::SetDatabaseServer("sqlite:" + mStore.filePath("none/none.sqlite").toUtf8());
    const Reply without = get(server->statusAddress(), "/readyz");
    EXPECT_EQ(without.status, 503);
    EXPECT_EQ(without.body, "The image database does not answer\n") << "no path, no address";
    ASSERT_TRUE(QDir().mkpath(mStore.filePath("meta")));
    const QByteArray address = "sqlite:" + mStore.filePath("kdd.sqlite").toUtf8();
    Result result;
    ASSERT_NE(Kxg::Catalogue::open(address, result), nullptr) << result.text().toStdString();
    Kxg::SetDatabaseServer(address);
    EXPECT_EQ(get(server->statusAddress(), "/readyz").body, "ready\n");
    QDir(mStore.folder()).removeRecursively();
    EXPECT_EQ(get(server->statusAddress(), "/readyz").status, 503);
}

TEST_F(ServerTest, KnowsOlderViewersBesideThePrefixAndBelow)
{
    const auto server = started();
    for (const QByteArray path : {"/wado", "/dicom-web/wado"}) {
        const Reply reply = get(server->address(), path + "?requestType=WADO");
        EXPECT_EQ(reply.status, 400);
        EXPECT_EQ(reply.body, "The parameter studyUID has to be a UID\n");
        EXPECT_EQ(get(server->address(), path + "/1.2").status, 404);
    }
}

TEST_F(ServerTest, CountsRequestsByGroupsOfItsOwn)
{
    const auto server = started();
    for (const char* path : {"/dicom-web/studies?PatientName=Doe", "/dicom-web/studies/1.2/metadata"})
        EXPECT_NE(get(server->address(), path).status, 0);
    for (const char* path : {"/a/b", "/c", "/dicom-web/studies/1.2/series/1.3/madeup", "/dicom-web/madeup"})
        EXPECT_EQ(get(server->address(), path).status, 404) << path;
    // A request counts once its answer is sent, which the client may know a moment sooner.
    const QByteArray last = "kdd_http_requests_total{route=\"other\",method=\"GET\",status=\"404\"} 4\n";
    QByteArray text;
    for (int look = 0; look < 1000 && !text.contains(last); ++look)
        text = get(server->statusAddress(), "/metrics").body;
    EXPECT_TRUE(text.contains(last));
    EXPECT_TRUE(text.contains("kdd_http_request_duration_seconds_count{route=\"studies\"} 1\n"));
    EXPECT_TRUE(text.contains("kdd_http_request_duration_seconds_count{route=\"metadata\"} 1\n"));
    EXPECT_TRUE(text.contains("kdd_http_request_duration_seconds_bucket{route=\"other\",le=\"+Inf\"} 4\n"));
    EXPECT_TRUE(text.contains("kdd_http_request_duration_seconds_count{route=\"other\"} 4\n"));
    EXPECT_TRUE(text.contains("\nkdd_cache_misses_total{cache=\"studies\"} 0\n"));
    EXPECT_TRUE(text.contains("\n# TYPE kdd_http_connections gauge\nkdd_http_connections "));
    EXPECT_FALSE(text.contains("Doe") || text.contains("madeup"));
}

TEST_F(ServerTest, TellsOfSlowRequestsWithoutTheirValues)
{
    LogCapture log;
    mSettings.slow = std::chrono::milliseconds(0);
    auto server = started();
    EXPECT_EQ(get(server->address(), "/x?PatientName=Doe&Jane&limit=5", "X-Request-Id: abc\r\n").status, 404);
    server.reset();
    EXPECT_EQ(log.count("Slow request abc: GET /x?PatientName&limit 404, "), 1);
    EXPECT_EQ(log.count("Doe") + log.count("Jane"), 0);
}

TEST_F(ServerTest, ServesTheViewerThatIsThere)
{
    mSettings.viewer = mStore.filePath("viewer");
    EXPECT_NE(refusal().find("no viewer with an index.html"), std::string::npos);
    QDir().mkpath(mSettings.viewer);
    QFile page(mSettings.viewer + QStringLiteral("/index.html"));
    ASSERT_TRUE(page.open(QIODevice::WriteOnly) && page.write("<html>") == 6);
    page.close();
    const auto server = started();
    EXPECT_EQ(get(server->address(), "/viewer?a=b").header("Location"), "viewer/?a=b");
    EXPECT_EQ(get(server->address(), "/viewer/").body, "<html>");
}

}  // namespace
