#include "server/faults/Served.h"
#include "support/Engines.h"

using namespace Kdd;

namespace
{

class DatabaseFaults : public Served, public testing::WithParamInterface<Engine>
{
protected:
    DatabaseFaults()
        : mDatabase("KDD_DATABASE", newDatabase(GetParam(), path("store/kdd.sqlite")).toStdString())
    {
    }

    void takeAway() const
    {
        if (GetParam() == Engine::Postgres)
            return stopPostgres();
        ASSERT_TRUE(QFile::rename(path("store/kdd.sqlite"), path("store/away")));
    }

    void bringBack() const
    {
        if (GetParam() == Engine::Postgres)
            return startPostgres();
        ASSERT_TRUE(QFile::rename(path("store/away"), path("store/kdd.sqlite")));
    }

    /// What each of the server's threads answers to a search.
    void expectOfAll(int status) const
    {
        onThreads(8, [&](int) {
            for (int i = 0; i < 4; ++i) {
                const Reply reply = get("studies");
                EXPECT_EQ(reply.status, status);
                EXPECT_EQ(reply.body.contains("kdd"), false) << "no address: " << reply.body.toStdString();
                EXPECT_FALSE(reply.body.isEmpty());
            }
        });
    }

    Setting mDatabase;
};

INSTANTIATE_TEST_SUITE_P(Engines, DatabaseFaults, kBothEngines, engineName);

TEST_P(DatabaseFaults, AreToldAndPassByThemselves)
{
    addTwoStudies();
    serve("--threads 4");
    expectOfAll(200);
    const qint64 descriptors = openDescriptors();
    for (int round = 0; round < 3; ++round) {
        takeAway();
        expectOfAll(503);
        EXPECT_EQ(status("/readyz").status, 503);
        EXPECT_EQ(get("studies/1.2/metadata").status, 200) << "of the tag file alone";
        bringBack();
        expectOfAll(200);
        EXPECT_EQ(status("/readyz").status, 200);
    }
    ASSERT_TRUE(hasNoConnections());
    // The threads that answer watchers may have opened theirs.
    EXPECT_LE(openDescriptors(), descriptors + 4 * 3) << "connections are given back";
    EXPECT_EQ(end(), 0);
}

using DatabaseServer = DatabaseFaults;

INSTANTIATE_TEST_SUITE_P(Engines, DatabaseServer, testing::Values(Engine::Postgres), engineName);

TEST_P(DatabaseServer, ThatIsAwayKeepsChangesFromBeingMade)
{
    addTwoStudies();
    serve("--stow --corrections --deletions");
    const QByteArray object = fileContent(file("3"));
    const auto statuses = [&] {
        const Reply replies[] = {ask("POST", "studies", "application/dicom", object),
                                 ask("POST", "studies/1.2/corrections?all=true", "application/json",
                                     R"({"login": "anna", "tags": [{"tag": "00100010", "value": "Poe^J"}]})"),
                                 ask("DELETE", "studies/1.3", "application/json", {})};
        std::string told;
        for (const Reply& reply : replies) {
            told += std::to_string(reply.status) + ' ';
            EXPECT_EQ(reply.status == 503, !reply.header("Retry-After").isEmpty());
        }
        return told;
    };
    takeAway();
    EXPECT_EQ(statuses(), "503 503 503 ");
    bringBack();
    EXPECT_FALSE(get("studies/1.2/metadata").body.contains("Poe^J"));
    EXPECT_EQ(get("studies/1.3/metadata").status, 200);
    EXPECT_EQ(statuses(), "200 200 200 ");
    EXPECT_TRUE(get("studies/1.2/metadata").body.contains("Poe^J"));
    EXPECT_EQ(end(), 0);
}

TEST_P(DatabaseServer, IsNotWaitedForWithoutEnd)
{
    const Setting patience("KDD_DATABASE_PATIENCE", "2");
    addTwoStudies();
    serve("--threads 4");
    expectOfAll(200);
    {
        const FrozenPostgres frozen;
        expectOfAll(503);
        EXPECT_EQ(status("/readyz").status, 503);
        EXPECT_EQ(get("studies/1.2/metadata").status, 200) << "of the tag file alone";
    }
    EXPECT_TRUE(comesTrue([this] { return get("studies").status == 200; }));
    expectOfAll(200);
    EXPECT_TRUE(fileContent(path("log")).contains("its server did not answer"));
    EXPECT_EQ(end(), 0);
}

using DatabaseFile = Served;

TEST_F(DatabaseFile, ThatIsPutInPlaceOfAnotherIsFollowed)
{
    addTwoStudies();
    serve("--threads 1");
    EXPECT_TRUE(get("studies").body.contains("\"1.2\""));
    // As an older copy is put back.
    for (const char* name : {"store/kdd.sqlite", "store/kdd.sqlite-wal", "store/kdd.sqlite-shm"})
        QFile::remove(path(name));
    for (const char* name : {"1", "2", "3"})
        QFile::remove(file(name));
    EXPECT_EQ(addImages().exitCode, 0);
    const QByteArray studies = get("studies").body;
    EXPECT_FALSE(studies.contains("\"1.2\"")) << studies.toStdString();
    EXPECT_TRUE(studies.contains("\"1.3\""));
}

}  // namespace
