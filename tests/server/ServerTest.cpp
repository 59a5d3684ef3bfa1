#include "server/ServerFixture.h"
#include "support/FileContent.h"

#include <QDir>

#include <kddlib/Catalogue.h>

using namespace Kdd;

namespace
{

class ServerTest : public ServerFixture
{
protected:
    ServerTest() { mSettings.status = Http::ListenAddress{"127.0.0.1", 0}; }

    static Reply get(const QByteArray& address, const QByteArray& path, const QByteArray& headers = {})
    {
        Client client(address);
        return client.ask(path, headers);
    }
};

TEST_F(ServerTest, RefusesAStatusAddressThatOtherMachinesReach)
{
    mSettings.status = Http::ListenAddress{"::", 0};
    EXPECT_NE(refusal().find("[::]:0 can be reached by other machines"), std::string::npos);
}

TEST_F(ServerTest, AnswersOnlyWhoNamesIt)
{
    start();
    for (const QByteArray& address : {mServer->address(), mServer->statusAddress()}) {
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
    start();
    EXPECT_EQ(get(mServer->statusAddress(), "/healthz").body, "alive\n");
    Kxg::SetDatabaseServer("sqlite:" + mStore.filePath("none/none.sqlite").toUtf8());
    const Reply without = get(mServer->statusAddress(), "/readyz");
    EXPECT_EQ(without.status, 503);
    EXPECT_EQ(without.body, "The image database does not answer\n") << "no path, no address";
    ASSERT_TRUE(QDir().mkpath(mStore.filePath("meta")));
    const QByteArray address = "sqlite:" + mStore.filePath("kdd.sqlite").toUtf8();
    Result result;
    ASSERT_NE(Kxg::Catalogue::open(address, result), nullptr) << result.text().toStdString();
    Kxg::SetDatabaseServer(address);
    EXPECT_EQ(get(mServer->statusAddress(), "/readyz").body, "ready\n");
    QDir(mStore.folder()).removeRecursively();
    EXPECT_EQ(get(mServer->statusAddress(), "/readyz").status, 503);
}

TEST_F(ServerTest, KnowsOlderViewersBesideThePrefixAndBelow)
{
    start();
    for (const QByteArray path : {"/wado", "/dicom-web/wado"}) {
        const Reply reply = get(mServer->address(), path + "?requestType=WADO");
        EXPECT_EQ(reply.status, 400);
        EXPECT_EQ(reply.body, "The parameter studyUID has to be a UID\n");
        EXPECT_EQ(get(mServer->address(), path + "/1.2").status, 404);
    }
}

TEST_F(ServerTest, CountsRequestsByGroupsOfItsOwn)
{
    start();
    for (const char* path : {"/dicom-web/studies?PatientName=Doe", "/dicom-web/studies/1.2/metadata"})
        EXPECT_NE(get(mServer->address(), path).status, 0);
    for (const char* path : {"/a/b", "/c", "/dicom-web/studies/1.2/series/1.3/madeup", "/dicom-web/madeup"})
        EXPECT_EQ(get(mServer->address(), path).status, 404) << path;
    // A request counts once its answer is sent, which the client may know a moment sooner.
    const QByteArray counted[] = {
        "kdd_http_requests_total{route=\"other\",method=\"GET\",status=\"404\"} 4\n",
        "kdd_http_request_duration_seconds_count{route=\"studies\"} 1\n",
        "kdd_http_request_duration_seconds_count{route=\"metadata\"} 1\n"};
    QByteArray text;
    for (const QByteArray& line : counted) {
        for (int look = 0; look < 1000 && !text.contains(line); ++look)
            text = get(mServer->statusAddress(), "/metrics").body;
        EXPECT_TRUE(text.contains(line)) << line.constData();
    }
    EXPECT_TRUE(text.contains("kdd_http_request_duration_seconds_bucket{route=\"other\",le=\"+Inf\"} 4\n"));
    EXPECT_TRUE(text.contains("kdd_http_request_duration_seconds_count{route=\"other\"} 4\n"));
    EXPECT_TRUE(text.contains("\nkdd_cache_misses_total{cache=\"studies\"} 0\n"));
    EXPECT_TRUE(text.contains("\n# TYPE kdd_http_connections gauge\nkdd_http_connections "));
    EXPECT_FALSE(text.contains("Doe") || text.contains("madeup"));
}

TEST_F(ServerTest, TellsOfSlowRequestsWithoutTheirValues)
{
    mSettings.slow = std::chrono::milliseconds(0);
    start();
    EXPECT_EQ(get(mServer->address(), "/x?PatientName=Doe&Jane&limit=5", "X-Request-Id: abc\r\n").status,
              404);
    mServer.reset();
    EXPECT_EQ(mLog.count("Slow request abc: GET /x?PatientName&limit 404, "), 1);
    EXPECT_EQ(mLog.count("Doe") + mLog.count("Jane"), 0);
}

TEST_F(ServerTest, ServesTheViewerThatIsThere)
{
    mSettings.viewer = mStore.filePath("viewer");
    EXPECT_NE(refusal().find("no viewer with an index.html"), std::string::npos);
    putFile(mSettings.viewer + QStringLiteral("/index.html"), "<html>");
    start();
    EXPECT_EQ(get(mServer->address(), "/viewer?a=b").header("Location"), "viewer/?a=b");
    EXPECT_EQ(get(mServer->address(), "/viewer/").body, "<html>");
}

}  // namespace
