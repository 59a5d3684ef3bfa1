#include "server/change/ChangedArchive.h"

#include <thread>

using namespace Kdd;

namespace
{

enum class Engine { Sqlite, Postgres };

/// On both engines.
class ChangeMeetsOthers : public ChangedArchive, public testing::WithParamInterface<Engine>
{
protected:
    ChangeMeetsOthers()
        : ChangedArchive(GetParam() == Engine::Postgres ? newPostgresDatabase() : QByteArray())
    {
        start();
    }

    /// Sends until it is not told that others work on the study.
    int correctAtLast(const QByteArray& query, const QByteArray& job) const
    {
        int status = 503;
        for (int i = 0; i < 100 && status == 503; ++i)
            status = correct("1.2", query, job).status;
        return status;
    }
};

TEST_P(ChangeMeetsOthers, KeepsACorrectionThroughWhateverComesNext)
{
    storeStudy();
    ASSERT_EQ(correct("1.2", "?series=1.2.3", R"({"tags":[{"tag":"00100010","value":"Roe^Jane"}]})").status,
              200);
    ASSERT_EQ(correct("1.2", "?image=1.2.4.1", R"({"tags":[{"tag":"0020000D","value":"1.5"}]})").status, 200);
    const auto check = [this](const char* after) {
        EXPECT_EQ(values("1.2", "00100010"), "Roe^Jane Roe^Jane") << after;
        EXPECT_EQ(values("1.5", "00080018"), "1.2.4.1") << after;
        EXPECT_TRUE(get("/studies?PatientName=roe").body.contains("\"1.2\"")) << after;
        EXPECT_EQ(objectOf(get("/studies/1.2/corrections"))[QLatin1String("corrections")].toArray().size(), 2)
            << after;
    };
    check("correction");
    kdd({QStringLiteral("build"), QStringLiteral("--all"), QStringLiteral("--again")});
    check("build");
    kdd({QStringLiteral("sync"), QStringLiteral("1.2")});
    check("sync");
    storeStudy();
    check("the same images");
    store(anImage("1.2.3.9"));
    EXPECT_EQ(values("1.2", "00100010"), "Roe^Jane Roe^Jane ");
    EXPECT_EQ(remove("/studies/1.2/series/1.2.3/instances/1.2.3.9").status, 200);
    check("deletion of another");
    kdd({QStringLiteral("verify"), QStringLiteral("--all")});
}

TEST_P(ChangeMeetsOthers, TellsOfATagFileThatIsMissingAndNotThatThereAreNoImages)
{
    storeStudy();
    kdd({QStringLiteral("build"), QStringLiteral("--all")});
    mServer.reset();
    mSettings.objects.reset();  // what arrives would have it made anew
    mSettings.takesByRequest = false;
    start();
    QFile::remove(TagFile::cacheFilePathForStudy("1.2"));
    const char* job = R"({"tags":[{"tag":"00100010","value":"Roe^Jane"}]})";
    EXPECT_EQ(correct("1.2", "?all=true", job).status, 500);
    kdd({QStringLiteral("build"), QStringLiteral("--all")});
    EXPECT_EQ(correct("1.2", "?all=true", job).status, 200);
    EXPECT_EQ(values("1.2", "00100010"), "Roe^Jane Roe^Jane Roe^Jane");
}

TEST_P(ChangeMeetsOthers, BringsBackWhatWasDeletedWithItsCorrections)
{
    storeStudy();
    ASSERT_EQ(correct("1.2", "?image=1.2.3.1", R"({"tags":[{"tag":"00100010","value":"Roe^Jane"}]})").status,
              200);
    EXPECT_EQ(objectOf(remove("/studies/1.2"))[QLatin1String("images")].toInt(), 3);
    EXPECT_EQ(get("/studies/1.2/metadata").status, 404);
    kdd({QStringLiteral("build"), QStringLiteral("--all")});
    EXPECT_EQ(get("/studies/1.2/metadata").status, 404);
    storeStudy();
    EXPECT_EQ(values("1.2", "00100010"), "Roe^Jane Doe^John Doe^John");
}

/// What is corrected, stored and built at the same time is all there afterwards.
TEST_P(ChangeMeetsOthers, LosesNothingWhenAllComeAtOnce)
{
    constexpr int kEach = 4;
    const auto uid = [](int sender, int i) {
        return QByteArray("1.2.3.") + QByteArray::number(100 * sender + i);
    };
    for (int sender = 1; sender <= 2; ++sender)
        for (int i = 0; i < kEach; ++i)
            store(anImage(uid(sender, i)).with(DCM_PatientName, "Doe^John"));
    std::vector<std::thread> threads;
    for (int sender = 1; sender <= 2; ++sender)
        threads.emplace_back([&, sender] {
            for (int i = 0; i < kEach; ++i)
                EXPECT_EQ(correctAtLast("?image=" + uid(sender, i),
                                        R"({"tags":[{"tag":"00100010","value":"Roe^Jane"}]})"),
                          200);
        });
    threads.emplace_back([&] {
        for (int i = 0; i < kEach; ++i)
            store(anImage(uid(3, i)).with(DCM_PatientName, "Doe^John"));
    });
    threads.emplace_back([&] {
        kdd({QStringLiteral("build"), QStringLiteral("--all"), QStringLiteral("--again")});
    });
    for (std::thread& thread : threads)
        thread.join();
    EXPECT_EQ(values("1.2", "00100010"), "Roe^Jane Roe^Jane Roe^Jane Roe^Jane Roe^Jane Roe^Jane Roe^Jane "
                                         "Roe^Jane Doe^John Doe^John Doe^John Doe^John");
    kdd({QStringLiteral("build")});
    kdd({QStringLiteral("verify"), QStringLiteral("--all")});
}

INSTANTIATE_TEST_SUITE_P(Engines, ChangeMeetsOthers, testing::Values(Engine::Sqlite, Engine::Postgres),
                         [](const auto& engine) {
                             return engine.param == Engine::Sqlite ? std::string("Sqlite")
                                                                   : std::string("Postgres");
                         });

}  // namespace
