#include "DatabaseFixture.h"
#include "support/Process.h"
#include "support/Threads.h"

using namespace Kxg;

namespace
{

class QueueTest : public DatabaseTest
{
protected:
    /// Registers studies "1" to `count`, each with a file.
    void addStudies(int count)
    {
        for (int i = 1; i <= count; ++i) {
            const QByteArray uid = QByteArray::number(i);
            add({dicom("/d/" + uid, uid, "1")});
        }
    }

    bool canClaim(const QByteArray& studyUID, int patience = 0)
    {
        std::unique_ptr<StudyClaim> claim;
        EXPECT_EQ(catalogue().claim(studyUID, patience, claim).text().toStdString(), "");
        return claim != nullptr;
    }
};

INSTANTIATE_TEST_SUITE_P(Engines, QueueTest, kBothEngines, engineName);

TEST_P(QueueTest, TheLongestWaitingFreeStudyIsNext)
{
    addStudies(1);
    for (int i = 0; i < 70; ++i)
        ASSERT_TRUE(catalogue().requestBuild({"1"}).good());
    addStudies(3);
    const auto first = claimNext();
    const auto third = claimNext({2});
    ASSERT_TRUE(first && third);
    EXPECT_EQ(first->studyInstanceUID(), "1");
    EXPECT_EQ(third->studyInstanceUID(), "3");
    EXPECT_FALSE(claimNext({2}));
    int waiting = 0;
    ASSERT_TRUE(catalogue().countWaiting(waiting).good());
    EXPECT_EQ(waiting, 3);
}

TEST_P(QueueTest, RequestsThatComeWhileAStudyIsBuiltMakeItWaitAgain)
{
    addStudies(1);
    for (const char* expected : {"1   1/2/0*\n", "1   1/2/0\n"}) {
        const auto claim = claimNext();
        ASSERT_TRUE(claim);
        if (studies() == "1   1/1/0*\n")
            add({dicom("/d/more", "1", "1", "2")});
        EXPECT_TRUE(claim->finish().good());
        EXPECT_EQ(studies(), expected);
    }
    EXPECT_FALSE(claimNext());
}

TEST_P(QueueTest, AStudyIsClaimedByNameUnlessItIsHeldOrUnknown)
{
    addStudies(1);
    {
        const auto held = claimNext();
        EXPECT_FALSE(canClaim("1"));
        // Its holder is not in his own way, and goes on holding a study that loses its files and gets new ones.
        EXPECT_TRUE(catalogue().removeStudy("1").good());
        addStudies(1);
        EXPECT_FALSE(canClaim("1"));
    }
    EXPECT_TRUE(canClaim("1"));
    ASSERT_TRUE(catalogue().requestBuild({"1", "1.9"}, Catalogue::IfGone::PassOver).good());
    std::unique_ptr<StudyClaim> claim;
    for (const Kdd::Result& result :
         {catalogue().claim("1.9", 0, claim), catalogue().requestBuild({"1", "1.9"})})
        EXPECT_TRUE(result.text().endsWith(QLatin1String(": there is no study 1.9")))
            << qPrintable(result.text());
}

TEST_P(QueueTest, ThreadsNeverHoldOneStudyTogetherAndLeaveNone)
{
    constexpr int kStudies = 40;
    addStudies(kStudies);
    std::atomic<int> holders[kStudies + 1] = {};
    std::atomic<int> built{0};
    Kdd::onThreads(4, [&](int) {
        const auto own = open();
        for (std::unique_ptr<StudyClaim> claim; own->claimNext({}, claim).good() && claim; claim.reset()) {
            EXPECT_EQ(++holders[claim->studyId()], 1);
            built += claim->finish().good() ? 1 : 0;
            --holders[claim->studyId()];
        }
    });
    EXPECT_EQ(built, kStudies);
}

TEST_P(QueueTest, AKilledProcessGivesItsStudyBack)
{
    addStudies(1);
    {
        std::unique_ptr<Catalogue> own;
        std::unique_ptr<StudyClaim> claim;
        const Kdd::StoppedProcess holder([&] {
            own = open();
            return own->claimNext({}, claim).good() && claim;
        });
        EXPECT_FALSE(canClaim("1"));
        EXPECT_FALSE(claimNext());
    }
    EXPECT_TRUE(canClaim("1", 20000));
    EXPECT_EQ(studies(), "1   1/1/0*\n");
}

TEST_P(QueueTest, FreshArrivalsAreLeftToThoseWhoTookThem)
{
    const auto isGiven = [&](int restMs) {
        std::unique_ptr<StudyClaim> claim;
        EXPECT_EQ(catalogue().claimRested({}, restMs, claim).text().toStdString(), "");
        return claim != nullptr;
    };
    constexpr int kDay = 24 * 3600 * 1000;
    addStudies(1);
    EXPECT_FALSE(isGiven(kDay));
    EXPECT_TRUE(isGiven(0)) << "as if they were old";
    const qint64 added = add({dicom("/d/more", "1", "1", "2")}).value("1");
    EXPECT_FALSE(isGiven(kDay));
    const qint64 changed = add({dicom("/d/more", "1", "1", "2")}).value("1");
    EXPECT_TRUE(isGiven(kDay)) << "a known file was registered anew";
    QVector<qint64> additions;
    ASSERT_TRUE(catalogue().additions("1", additions).good());
    EXPECT_TRUE(additions.contains(added) && !additions.contains(changed) && additions.size() == 2);
}

TEST_P(QueueTest, ObjectsAreAwaitedUntilTheyAreTriedInVain)
{
    const auto isAwaited = [&](const char* folder) {
        bool awaits = false;
        EXPECT_EQ(catalogue().awaitsObjects("1", folder, awaits).text().toStdString(), "");
        return awaits;
    };
    const auto built = [](bool isComplete) {
        BuiltStudy study;
        study.isComplete = isComplete;
        return study;
    };
    EXPECT_FALSE(isAwaited("/d"));
    addStudies(1);
    EXPECT_TRUE(isAwaited("/d"));
    EXPECT_FALSE(isAwaited("/e")) << "others may wait for long";
    // What changes the tag file as it is leaves to others what waits.
    qint64 request = 0;
    auto claim = claimNext();
    ASSERT_TRUE(claim && catalogue().requestRewrite("1", request).good());
    ASSERT_TRUE(claim->finishChange(built(true), request).good());
    EXPECT_TRUE(isAwaited("/d"));
    claim.reset();
    claim = claimNext();
    add({dicom("/d/more", "1", "1", "2")});
    ASSERT_TRUE(claim && claim->finish(built(false)).good());
    EXPECT_TRUE(isAwaited("/d")) << "what came meanwhile was not tried";
    claim.reset();
    claim = claimNext();
    ASSERT_TRUE(claim && claim->finish(built(false)).good());
    EXPECT_FALSE(isAwaited("/d"));
    claim.reset();
    EXPECT_TRUE(canClaim("1") && claimNext()) << "workers try it again";
    add({dicom("/d/third", "1", "1", "3")});
    EXPECT_TRUE(isAwaited("/d"));
    claim = claimNext();
    ASSERT_TRUE(claim && claim->finish(built(true)).good());
    EXPECT_FALSE(isAwaited("/d"));
}

TEST_P(QueueTest, AllWhoMakeTheDatabaseAtOnceSucceed)
{
    std::atomic<int> opened{0};
    Kdd::onThreads(8, [&](int) { opened += open() ? 1 : 0; });
    EXPECT_EQ(opened, 8);
    addStudies(1);
}

}  // namespace
