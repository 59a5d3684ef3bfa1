#include "SearchFixture.h"
#include "platform/database/ChangeLog.h"
#include "platform/database/SearchRows.h"
#include "platform/database/StudyContent.h"
#include "support/Threads.h"

#include <atomic>

using namespace Kxg;

namespace
{

class StudyChangesTest : public SearchTest
{
protected:
    /// So many studies more, whose UIDs count on.
    void arrive(int count)
    {
        catalogue();
        SqlConnection connection(parsedAddress(), SqlConnection::IfAbsent::Fail);
        connection.transact(SqlConnection::Access::Write, [&] {
            for (int i = 0; i < count; ++i) {
                const QByteArray uid = QByteArray::number(++mArrived);
                putSearchRows(connection, obtainStudy(connection, uid).id,
                              aStudy("A", "20240101", uid.constData(), {"CT"}), {});
                noteChange(connection, {ChangeKind::Arrived, uid, {}, {}, 10});
            }
        });
    }

    int arrived() const { return mArrived; }

private:
    int mArrived = 0;
};

INSTANTIATE_TEST_SUITE_P(Engines, StudyChangesTest, kBothEngines, engineName);

TEST_P(StudyChangesTest, GoesPastChangesThatMayNotBeSeen)
{
    for (const char* uid : {"1", "2", "3", "4"})
        build(uid, aStudy("A", "20240101", uid, {"CT"}));
    search().limitTo(
        std::make_shared<StudyLimits>(StudyLimits{{{StudyLimit::Of::Uid, "0020000D", {"2", "3"}}}}));
    std::vector<StudyChangeNote> noted;
    qint64 last = 0;
    for (const qint64 position : {2, 3}) {
        ASSERT_TRUE(search().changes(last, 1, noted, last).good());
        EXPECT_EQ(last, position);
        EXPECT_EQ(noted.size(), 1U);
    }
    ASSERT_TRUE(search().changes(last, 1, noted, last).good());
    EXPECT_EQ(last, 4);
    EXPECT_EQ(noted.size(), 0U);
}

/// Whatever isolation a server is set up for.
TEST_P(StudyChangesTest, WhoFollowsTheChangesMissesNone)
{
    constexpr int kWriters = 4;
    constexpr int kStudies = 10;
    if (GetParam() == Engine::Postgres)
        execute("ALTER DATABASE " + address().mid(address().lastIndexOf("@/") + 2).split('?').front() +
                " SET default_transaction_isolation = 'repeatable read'");
    catalogue();
    std::atomic<int> writing{kWriters};
    qint64 last = 0;
    Kdd::onThreads(kWriters + 1, [&](int thread) {
        Kdd::Result result;
        const auto follower = StudySearch::open(address(), result);
        const auto writer = open();
        for (int i = 0; i < kStudies && thread < kWriters; ++i) {
            const QByteArray uid = QByteArray::number(thread) + '.' + QByteArray::number(i);
            QMap<QByteArray, qint64> requests;
            EXPECT_TRUE(writer->registerFiles({{dicom(uid, uid, uid, uid)}, {}, {}}, requests).good());
            std::unique_ptr<StudyClaim> claim;
            EXPECT_TRUE(writer->claim(uid, 0, claim, Catalogue::IfAbsent::Fail).good());
            BuiltStudy built;
            built.tagFile = {5, uid};
            built.search = aStudy("A", "20240101", "P", {"CT"});
            EXPECT_EQ(claim->finish(built).text().toStdString(), "");
        }
        if (thread < kWriters) {
            --writing;
            return;
        }
        std::vector<StudyChangeNote> noted;
        for (bool isLast = false; !isLast || !noted.empty();) {
            isLast = writing == 0;  // asked before, so that the last look comes after the last change
            qint64 position = last;
            EXPECT_TRUE(follower->changes(last, 3, noted, position).good());
            for (const StudyChangeNote& each : noted)
                EXPECT_EQ(each.position, ++last);
            EXPECT_EQ(position, last);
        }
    });
    EXPECT_EQ(last, kWriters * kStudies);
}

/// Also where one of many may be seen alone, and while more come.
TEST_P(StudyChangesTest, ThousandThatCameBetweenTwoRequestsAreToldOnceEachPageByPage)
{
    arrive(10);
    qint64 last = 0;
    std::vector<StudyChangeNote> page;
    ASSERT_TRUE(search().changes(0, 100, page, last).good());
    arrive(1000);
    // So many on a page, and of so many studies one may be seen.
    for (const auto& [size, seen] : {std::pair(100, 1), {7, 1}, {5000, 1}, {100, 7}, {1, 300}, {100, 2000}}) {
        StudyLimit limit{StudyLimit::Of::Uid, "0020000D", {}};
        for (int uid = seen; uid < 2000; uid += seen)
            limit.values << QByteArray::number(uid);
        search().limitTo(seen == 1 ? nullptr : std::make_shared<StudyLimits>(StudyLimits{{limit}}));
        qint64 expected = 10 - 10 % seen;
        bool isFirst = true;
        for (qint64 position = last; position < arrived(); isFirst = false) {
            ASSERT_TRUE(search().changes(position, size, page, position).good());
            ASSERT_LE(page.size(), static_cast<std::size_t>(size));
            for (const StudyChangeNote& change : page)
                EXPECT_EQ(change.studyInstanceUID.toLongLong(), expected += seen);
            EXPECT_GE(position, page.empty() ? arrived() : page.back().position);
            if (isFirst)
                arrive(1);
        }
        EXPECT_EQ(expected, arrived() - arrived() % seen);
    }
}

}  // namespace
