#include "server/change/ChangedArchive.h"
#include "support/Engines.h"
#include "support/Threads.h"

using namespace Kdd;

namespace
{

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
    ASSERT_EQ(correct("1.2", "?series=1.2.3", kRenamed).status, 200);
    ASSERT_EQ(correct("1.2", "?image=1.2.4.1", R"({"tags":[{"tag":"0020000D","value":"1.5"}]})").status, 200);
    const auto check = [this](const char* after) {
        EXPECT_EQ(values("1.2", "00100010"), "Roe^Jane Roe^Jane") << after;
        EXPECT_EQ(values("1.5", "00080018"), "1.2.4.1") << after;
        EXPECT_TRUE(get("/studies?PatientName=roe").body.contains("\"1.2\"")) << after;
        EXPECT_EQ(jsonAt(get("/studies/1.2/corrections").body, "corrections").toArray().size(), 2) << after;
    };
    check("correction");
    kdd("build --all --again");
    check("build");
    kdd("sync 1.2");
    check("sync");
    storeStudy();
    check("the same images");
    store(anImage("1.2.3.9"));
    EXPECT_EQ(values("1.2", "00100010"), "Roe^Jane Roe^Jane ");
    EXPECT_EQ(remove("/studies/1.2/series/1.2.3/instances/1.2.3.9").status, 200);
    check("deletion of another");
    kdd("verify --all");
}

TEST_P(ChangeMeetsOthers, TellsOfATagFileThatIsMissingAndNotThatThereAreNoImages)
{
    storeStudy();
    kdd("build --all");
    mServer.reset();
    mSettings.objects.reset();  // what arrives would have it made anew
    mSettings.takesByRequest = false;
    start();
    QFile::remove(TagFile::cacheFilePathForStudy("1.2"));
    EXPECT_EQ(correct("1.2", "?all=true", kRenamed).status, 500);
    kdd("build --all");
    EXPECT_EQ(correct("1.2", "?all=true", kRenamed).status, 200);
    EXPECT_EQ(values("1.2", "00100010"), "Roe^Jane Roe^Jane Roe^Jane");
}

TEST_P(ChangeMeetsOthers, BringsBackWhatWasDeletedWithItsCorrections)
{
    storeStudy();
    ASSERT_EQ(correct("1.2", "?image=1.2.3.1", kRenamed).status, 200);
    EXPECT_EQ(jsonAt(remove("/studies/1.2").body, "images"), 3);
    EXPECT_EQ(get("/studies/1.2/metadata").status, 404);
    kdd("build --all");
    EXPECT_EQ(get("/studies/1.2/metadata").status, 404);
    storeStudy();
    EXPECT_EQ(values("1.2", "00100010"), "Roe^Jane Doe^John Doe^John");
}

/// What is corrected, stored and built at the same time is all there afterwards.
TEST_P(ChangeMeetsOthers, LosesNothingWhenAllComeAtOnce)
{
    constexpr int kEach = 4;
    const auto uid = [](int sender, int i) { return "1.2.3." + QByteArray::number(100 * (sender + 1) + i); };
    const auto storeThoseOf = [&](int sender) {
        for (int i = 0; i < kEach; ++i)
            store(anImage(uid(sender, i)).with(DCM_PatientName, "Doe^John"));
    };
    storeThoseOf(0);
    storeThoseOf(1);
    onThreads(4, [&](int thread) {
        if (thread == 2)
            storeThoseOf(2);
        else if (thread == 3)
            kdd("build --all --again");
        else
            for (int i = 0; i < kEach; ++i)
                EXPECT_EQ(correctAtLast("?image=" + uid(thread, i), kRenamed), 200);
    });
    EXPECT_EQ(values("1.2", "00100010"), "Roe^Jane Roe^Jane Roe^Jane Roe^Jane Roe^Jane Roe^Jane Roe^Jane "
                                         "Roe^Jane Doe^John Doe^John Doe^John Doe^John");
    kdd("build");
    kdd("verify --all");
}

INSTANTIATE_TEST_SUITE_P(Engines, ChangeMeetsOthers, kBothEngines, engineName);

}  // namespace
