#include "CommandLineFixture.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagfile/qa/QAAudit.h"
#include "kddlib/tagmodel/TagMap.h"

#include <QElapsedTimer>
#include <QSet>

#include <random>

using namespace Kdd;

namespace
{

using Uids = QList<QByteArray>;

/// Corrections through the tool.
class Correction : public CommandLine
{
protected:
    Correction() { TagFile::setMetaFolder(path("store/meta").toLocal8Bit().constData()); }

    QString job(const QByteArray& oldStudy, const char* key, const QByteArray& value) const
    {
        put("job.xml", "<Job><Timestamp>20240131120000</Timestamp><Substitutions OldSUID='" + oldStudy +
                           "'><Tag " + key + "><Value>" + value + "</Value></Tag></Substitutions></Job>");
        return file("job.xml");
    }

    Answer correct(const QString& job, const char* arguments) const
    {
        return kdd("qa --json", QStringList{job} + QString::fromLatin1(arguments).split(QLatin1Char(' ')));
    }

    static std::unique_ptr<TagFile> stored(const char* study)
    {
        auto file = std::make_unique<TagFile>();
        file->readCacheFileForStudy(study, false);
        return file;
    }
};

constexpr const char* kPatientName = "Group='0010' Element='0010'";
constexpr const char* kSeries = "Group='0020' Element='000e'";

TEST_F(Correction, TellsWhatItDid)
{
    addTwoStudies();
    const QString edit = job("", kPatientName, "Roe^R");
    EXPECT_EQ(correct(edit, "--study 1.2 --image 1 2").out,
              "{\"changed\":2,\"images\":2,\"moved\":0,\"notFound\":0}\n");
    EXPECT_TRUE(kdd("metadata 1.2 --image 1").out.contains("Roe^R"));
    put("images.txt", "3\n\n 1 \n9\n");
    const Answer listed =
        correct(edit, ("--study 1.2 --images " + file("images.txt").toLatin1()).constData());
    EXPECT_EQ(listed.out, "{\"changed\":1,\"images\":3,\"moved\":0,\"notFound\":1}\n");
    EXPECT_EQ(listed.exitCode, 1);
    EXPECT_TRUE(listed.err.contains("There is no image 9 in study 1.2"));
    EXPECT_EQ(correct(job("1.3", kSeries, "1.2.9"), "--study 1.2 --image 4").number("moved"), 1);
    EXPECT_EQ(imagesOf("1.2"), 4);
    EXPECT_EQ(correct(file("job.xml"), "--study 1.2 --image 4").exitCode, 0) << "it is done already";
}

TEST_F(Correction, NamesWhatIsWrong)
{
    addTwoStudies();
    const QString edit = job("", kPatientName, "Roe^R");
    put("broken.xml", "<Job>\n<Tag Group='x'/></Job>");
    EXPECT_EQ(correct(edit, "--study 1.2").exitCode, 2) << "no image";
    EXPECT_EQ(kdd("qa", QStringList{edit}).exitCode, 2) << "no study";
    EXPECT_TRUE(correct(edit, "--study 9.9 --image 1").err.contains("No study is named \"9.9\""));
    EXPECT_TRUE(correct(file("none.xml"), "--study 1.2 --image 1").err.contains("none.xml"));
    const Answer broken = correct(file("broken.xml"), "--study 1.2 --image 1");
    EXPECT_EQ(broken.exitCode, 1);
    EXPECT_TRUE(broken.err.contains("Line 2: Group \"x\"")) << broken.err.toStdString();
    const Answer refused = correct(job("", kSeries, "no uid"), "--study 1.2 --image 1");
    EXPECT_EQ(refused.exitCode, 1);
    EXPECT_TRUE(refused.err.contains("\"no uid\" is no UID"));
    EXPECT_TRUE(
        correct(job("7.7", kSeries, "8.1"), "--study 8.8 --image 1").err.contains("Neither study 7.7"));
}

/// Whenever the process dies, no image is lost, and running the job again completes it as if nothing had happened. Both
/// studies have so much else that the time between the two writes is a good part of the whole.
TEST_F(Correction, MovesThatAreKilledAreCompletedByTheNext)
{
    constexpr int kMoving = 20;
    constexpr int kStaying = 60;
    std::mt19937 random(3);
    QStringList moving = {QStringLiteral("--compression"), QStringLiteral("lzma"), QStringLiteral("--image")};
    for (int i = 0; i < kMoving + 2 * kStaying; ++i) {
        QByteArray noise;
        while (noise.size() < 900)
            noise += QByteArray::number(static_cast<unsigned>(random()));
        const QByteArray uid = QByteArray::number(i);
        const bool isThere = i >= kMoving + kStaying;
        save(uid.constData(), anImage(uid.constData())
                                  .inStudy(isThere ? "1.9" : "1.2")
                                  .inSeries(i < kMoving ? "1.2.1"
                                            : isThere   ? "1.9.2"
                                                        : "1.2.2")
                                  .with(DCM_ImageComments, noise.constData()));
        if (i < kMoving)
            moving.append(QString::fromLatin1(uid));
    }
    EXPECT_EQ(addImages().number("images"), kMoving + 2 * kStaying);
    unsigned duration = 0;
    for (unsigned round = 0; round < 20; ++round) {
        const char* const from = round % 2 == 0 ? "1.2" : "1.9";
        const char* const to = round % 2 == 0 ? "1.9" : "1.2";
        const QStringList move = QStringList{job(from, kSeries, to + QByteArray(".1")),
                                             QStringLiteral("--study"), QString::fromLatin1(to)} +
                                 moving;
        QElapsedTimer timer;
        timer.start();
        const auto killed = start("qa", move);
        killed->waitForFinished(round == 0 ? kTimeout : static_cast<int>(random() % duration));
        duration = round == 0 ? static_cast<unsigned>(timer.elapsed()) + 1 : duration;
        killed->kill();
        killed->waitForFinished(kTimeout);
        const Uids between = stored(from)->imagesByUID().keys() + stored(to)->imagesByUID().keys();
        EXPECT_EQ(QSet<QByteArray>(between.begin(), between.end()).size(), kMoving + 2 * kStaying);
        const Answer again = kdd("qa", move);
        EXPECT_EQ(again.exitCode, 0) << again.err.toStdString();
        EXPECT_EQ(stored(from)->imagesByUID().size(), kStaying);
        const auto there = stored(to);
        const TagMap* series = there->findSeries(to + QByteArray(".1"));
        ASSERT_NE(series, nullptr);
        EXPECT_EQ(series->children().size(), kMoving);
        for (const TagMap* image : series->children()) {
            AuditLog log;
            QVector<AuditEntry> entries;
            EXPECT_TRUE(log.read(*image) && log.decode(entries));
            EXPECT_EQ(entries.size(), int(round) + 1);
        }
    }
}

}  // namespace
