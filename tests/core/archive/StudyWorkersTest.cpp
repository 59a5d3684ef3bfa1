#include "kddlib/archive/StudyWorkers.h"

#include "kddlib/archive/ArchiveDatabase.h"
#include "kddlib/archive/DicomInput.h"
#include "kddlib/archive/Registration.h"
#include "kddlib/tagfile/TagFile.h"
#include "support/DatasetBuilder.h"
#include "support/EngineTest.h"

#include <QFile>

#include <array>

using namespace Kdd;

namespace
{

constexpr StudyWorkers::Pace kSwift = {std::chrono::milliseconds(20), std::chrono::milliseconds(20),
                                       std::chrono::milliseconds(0), std::chrono::milliseconds(20),
                                       std::chrono::milliseconds(20)};

class StudyWorkersTest : public EngineTest
{
protected:
    /// Of the study "1.N" as many images.
    void index(int study, int images) const
    {
        const auto database = openCatalogue();
        Registration registration(*database);
        for (int i = 1; i <= images; ++i) {
            const QByteArray uid = "1." + QByteArray::number(study);
            const QByteArray name = uid + ".3." + QByteArray::number(i);
            const QString path = mStore.filePath(name.constData());
            anImage(name).inStudy(uid).inSeries(uid + ".3").save(path);
            EXPECT_TRUE(registration.add(readDicomInput(path.toUtf8(), Damage::Refused)).good());
        }
        EXPECT_TRUE(registration.flush().good());
    }

    int countWaiting() const
    {
        int waiting = -1;
        EXPECT_TRUE(openCatalogue()->countWaiting(waiting).good());
        return waiting;
    }
};

INSTANTIATE_TEST_SUITE_P(Engines, StudyWorkersTest, kBothEngines, engineName);

TEST_P(StudyWorkersTest, CompleteWhatWaitsAndWhatComesToWait)
{
    index(1, 2);
    StudyWorkers workers(2, kSwift);
    workers.start();
    EXPECT_TRUE(comesTrue([this] { return countWaiting() == 0; }));
    index(2, 3);
    EXPECT_TRUE(comesTrue([this] { return countWaiting() == 0; }));
    workers.stop();
    EXPECT_EQ(workers.completed(), 2);
    TagFile file;
    ASSERT_TRUE(file.readCacheFileForStudy("1.2", false));
    EXPECT_EQ(file.imagesByUID().size(), 3);
}

TEST_P(StudyWorkersTest, LeaveAloneWhatHasJustArrived)
{
    index(1, 1);
    index(2, 1);
    ASSERT_TRUE(openCatalogue()->requestBuild({"1.2"}).good());
    StudyWorkers::Pace patient = kSwift;
    patient.arrivals = std::chrono::hours(24);
    StudyWorkers workers(1, patient);
    workers.start();
    EXPECT_TRUE(comesTrue([this] { return countWaiting() == 1; }));
    workers.stop();
    EXPECT_EQ(workers.completed(), 1);
    EXPECT_FALSE(QFile::exists(TagFile::cacheFilePathForStudy("1.1")));
}

TEST_P(StudyWorkersTest, TryAgainWhatFailedAndGoOnWithOthers)
{
    index(1, 1);
    const QString path = mStore.filePath("1.1.3.1");
    ASSERT_TRUE(QFile::rename(path, path + QStringLiteral(".away")));
    StudyWorkers workers(1, kSwift);
    workers.start();
    EXPECT_TRUE(comesTrue([this] { return countWaiting() == 1 && mLog.count("is not built") > 1; }));
    index(2, 1);
    EXPECT_TRUE(comesTrue([this] { return countWaiting() == 1; }));
    ASSERT_TRUE(QFile::rename(path + QStringLiteral(".away"), path));
    EXPECT_TRUE(comesTrue([this] { return countWaiting() == 0; }));
}

TEST_P(StudyWorkersTest, GoOnWhenTheDatabaseIsThereAgain)
{
    const QString file = mStore.filePath("kdd.sqlite");
    const QString away = mStore.filePath("away");
    // Its log is never without it.
    const auto moveFiles = [](const QString& from, const QString& to, std::array<const char*, 3> tails) {
        for (const char* tail : tails)
            QFile::rename(from + QLatin1String(tail), to + QLatin1String(tail));
    };
    index(1, 1);
    StudyWorkers workers(2, kSwift);
    workers.start();
    EXPECT_TRUE(comesTrue([this] { return countWaiting() == 0; }));
    GetParam() == Engine::Sqlite ? moveFiles(file, away, {"", "-wal", "-shm"}) : stopPostgres();
    while (mLog.count("Waiting for the database") == 0)
        QThread::yieldCurrentThread();
    GetParam() == Engine::Sqlite ? moveFiles(away, file, {"-wal", "-shm", ""}) : startPostgres();
    index(2, 1);
    EXPECT_TRUE(comesTrue([this] { return countWaiting() == 0; }));
    EXPECT_TRUE(comesTrue([this] { return countWaiting() == 0 && mLog.count("answers again") == 1; }));
    EXPECT_EQ(mLog.count("Waiting for the database"), 1) << "once for all of them";
}

}  // namespace
