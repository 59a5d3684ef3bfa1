#include "CommandLineFixture.h"
#include "kddlib/tagfile/TagFile.h"

#include <QElapsedTimer>
#include <QSet>

#include <random>

using namespace Kdd;

namespace
{

/// Corrections through the tool.
class Correction : public CommandLine
{
protected:
    Correction() { TagFile::setMetaFolder(path("store/meta").toLocal8Bit().constData()); }

    /// Makes the job anew and runs it.
    Answer correct(const DcmTagKey& key, const QByteArray& value, const QByteArray& oldStudy,
                   const QByteArray& arguments) const
    {
        return kdd("qa --json " + job(key, value, oldStudy) + ' ' + arguments);
    }

    /// The images of a tag file.
    static QSet<QByteArray> stored(const char* study)
    {
        TagFile file;
        file.readCacheFileForStudy(study, false);
        const QList<QByteArray> uids = file.imagesByUID().keys();
        return {uids.begin(), uids.end()};
    }
};

TEST_F(Correction, TellsWhatItDid)
{
    addTwoStudies();
    const QByteArray edit = "qa --json --study 1.2 " + job(DCM_PatientName, "Roe^R");
    EXPECT_EQ(kdd(edit + " --image 1 2").out, "{\"changed\":2,\"images\":2,\"moved\":0,\"notFound\":0}\n");
    EXPECT_EQ(kdd(edit).exitCode, 2) << "no images";
    EXPECT_TRUE(kdd("metadata 1.2 --image 1").out.contains("Roe^R"));
    put("images.txt", "3\n\n 1 \n9\n");
    const Answer listed = kdd(edit + " --images @images.txt");
    EXPECT_EQ(listed.out, "{\"changed\":1,\"images\":3,\"moved\":0,\"notFound\":1}\n");
    EXPECT_EQ(listed.exitCode, 1);
    EXPECT_TRUE(listed.err.contains("There is no image 9 in study 1.2"));
    for (const int moved : {1, 0}) {
        const Answer move = correct(DCM_SeriesInstanceUID, "1.2.9", "1.3", "--study 1.2 --image 4");
        EXPECT_EQ(move.number("moved"), moved);
        EXPECT_EQ(move.exitCode, 0) << "the second time it is done already";
        EXPECT_EQ(imagesOf("1.2"), 4);
    }
}

TEST_F(Correction, AnImageThatWasReplacedComesBackWhenTheOtherOneMovesOn)
{
    addTwoStudies();
    save("5", anImage("4").inStudy("1.2").inSeries("1.2.4").with(DCM_PatientName, "Doe^J"));
    save("6", anImage("6").inStudy("1.3").inSeries("1.3.1"));
    EXPECT_EQ(addImages().exitCode, 0);
    EXPECT_EQ(correct(DCM_SeriesInstanceUID, "1.3.1", "1.2", "--study 1.3 --image 4").number("moved"), 1);
    EXPECT_EQ(correct(DCM_SeriesInstanceUID, "1.2.4", "1.3", "--study 1.2 --image 4").number("moved"), 1);
    EXPECT_EQ(listed("--waiting"), "1.3");
    EXPECT_EQ(kdd("build").exitCode, 0);
    EXPECT_EQ(stored("1.3"), (QSet<QByteArray>{"4", "6"}));
    EXPECT_EQ(kdd("verify --all").exitCode, 0);
}

TEST_F(Correction, IsPreviewedWithoutAnyChange)
{
    addTwoStudies();
    const QByteArray before = kdd("metadata 1.2").out;
    const Answer told = kdd("qa " + job(DCM_PatientName, "Roe^R") + " --study 1.2 --image 1 2 9 --preview");
    EXPECT_EQ(told.out, "2 images:\n  00100010 PatientName: \"Doe^J\" -> \"Roe^R\"\n"
                        "3 images: 2 would be changed, 0 moved, 1 not found\n");
    EXPECT_EQ(told.exitCode, 1);
    const Answer move = correct(DCM_SeriesInstanceUID, "1.2.9", "1.3", "--study 1.2 --image 4 --preview");
    EXPECT_EQ(move.number("moved"), 1);
    EXPECT_EQ(move.json("changes/0/images"), QJsonArray{QStringLiteral("4")});
    EXPECT_EQ(correct(DCM_PatientBirthDate, "soon", "", "--study 1.2 --image 1 --preview").exitCode, 1);
    EXPECT_EQ(kdd("metadata 1.2").out, before);
    EXPECT_EQ(imagesOf("1.3"), 1);
}

TEST_F(Correction, TakesItsJobAsJsonToo)
{
    addTwoStudies();
    const auto ask = [&](const QByteArray& text) {
        put("job.json", text);
        return kdd("qa --json @job.json --study 1.2");
    };
    const Answer done = ask("\n {\"tags\": [{\"tag\": \"00100010\", \"value\": \"Roe^R\"}],"
                            " \"series\": [\"1.2.4\"], \"images\": [\"1\"]}");
    EXPECT_EQ(done.out, "{\"changed\":3,\"images\":3,\"moved\":0,\"notFound\":0}\n");
    EXPECT_FALSE(kdd("metadata 1.2").out.contains("Doe^J"));
    EXPECT_TRUE(ask(R"({"series": ["7"]})").err.contains("There is no series 7 in study 1.2"));
    EXPECT_TRUE(
        ask(R"({"series": ["1.2.4"], "series": []})").err.contains("job.json: The job is no JSON object"));
    EXPECT_EQ(ask("{}").exitCode, 2) << "no images";
}

/// Whenever the process dies, no image is lost, and running the job again completes it as if nothing had happened. Both
/// studies have so much else that the time between the two writes is a good part of the whole.
TEST_F(Correction, MovesThatAreKilledAreCompletedByTheNext)
{
    constexpr int kMoving = 20;
    constexpr int kStaying = 60;
    std::mt19937 random(3);
    QByteArray moving = " --compression lzma --image";
    for (int i = 0; i < kMoving + 2 * kStaying; ++i) {
        QByteArray noise;
        while (noise.size() < 900)
            noise += QByteArray::number(static_cast<unsigned>(random()));
        const QByteArray uid = QByteArray::number(i);
        const QByteArray study = i < kMoving + kStaying ? "1.2" : "1.9";
        save(uid.constData(), anImage(uid)
                                  .inStudy(study)
                                  .inSeries((study + (i < kMoving ? ".1" : ".2")).constData())
                                  .with(DCM_ImageComments, noise));
        if (i < kMoving)
            moving += ' ' + uid;
    }
    EXPECT_EQ(addImages().exitCode, 0);
    unsigned duration = 0;
    for (unsigned round = 0; round < 20; ++round) {
        const char* const from = round % 2 == 0 ? "1.2" : "1.9";
        const char* const to = round % 2 == 0 ? "1.9" : "1.2";
        const QByteArray move =
            "qa " + job(DCM_SeriesInstanceUID, to + QByteArray(".1"), from) + " --study " + to + moving;
        QElapsedTimer timer;
        timer.start();
        const auto killed = start(move);
        killed->waitForFinished(round == 0 ? kTimeout : static_cast<int>(random() % duration));
        duration = round == 0 ? static_cast<unsigned>(timer.elapsed()) + 1 : duration;
        killed->kill();
        killed->waitForFinished(kTimeout);
        EXPECT_EQ((stored(from) + stored(to)).size(), kMoving + 2 * kStaying);
        const Answer again = kdd(move);
        EXPECT_EQ(again.exitCode, 0) << again.err.toStdString();
        EXPECT_EQ(stored(from).size(), kStaying);
        EXPECT_EQ(stored(to).size(), kMoving + kStaying);
    }
    EXPECT_EQ(kdd("build --all").exitCode, 0);
    EXPECT_EQ(kdd("verify --all --json").number("images"), kMoving + 2 * kStaying);
}

}  // namespace
