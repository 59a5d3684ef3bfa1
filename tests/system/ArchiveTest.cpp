#include "CommandLineFixture.h"
#include "support/PostgresServer.h"

#include <QDirIterator>
#include <QImage>
#include <QMap>

#include <random>

using namespace Kdd;

namespace
{

/// The commands that work on a whole archive through its database.
class Archive : public CommandLine
{
protected:
    int sample(int count) const
    {
        const Answer answer = kdd(("sample --json @ --images " + QByteArray::number(count)).constData());
        EXPECT_EQ(answer.exitCode, 0) << answer.err.toStdString();
        return answer.number("images");
    }

    /// The content of every tag file by its path below the meta folder.
    QMap<QString, QByteArray> tagFiles(const char* store = "store") const
    {
        const QDir meta(path(store) + QStringLiteral("/meta"));
        QMap<QString, QByteArray> contents;
        for (QDirIterator it(meta.path(), {QStringLiteral("*.tc")}, QDir::Files,
                             QDirIterator::Subdirectories);
             it.hasNext();) {
            QFile file(it.next());
            EXPECT_TRUE(file.open(QIODevice::ReadOnly));
            contents.insert(meta.relativeFilePath(file.fileName()), file.readAll());
        }
        return contents;
    }

    Answer indexImages() const { return kdd("index --json @"); }
};

TEST_F(Archive, WhatIsIndexedWaitsAndWhatIsBuiltDoesNot)
{
    addTwoStudies();
    const QByteArray added = kdd("metadata 1.2").out;
    QDir(path("store")).removeRecursively();
    EXPECT_EQ(indexImages().number("images"), 4);
    EXPECT_EQ(listed("--waiting"), "1.2 1.3");
    EXPECT_EQ(kdd("build 1.3 --json").number("images"), 1);
    EXPECT_EQ(listed("--waiting"), "1.2");
    EXPECT_EQ(kdd("build --all --json").number("studies"), 1);
    EXPECT_EQ(kdd("metadata 1.2").out, added);
    EXPECT_EQ(indexImages().number("unchanged"), 4);
    EXPECT_EQ(kdd("build --all --json").number("studies"), 0);
    EXPECT_EQ(kdd("build --all --again --json --jobs 3").number("studies"), 2);
    QDir(path("store/meta")).removeRecursively();
    EXPECT_EQ(kdd("build --json").number("studies"), 0) << "nothing changed";
    EXPECT_EQ(kdd("build --all --json").number("studies"), 2) << "but their tag files are gone";
    EXPECT_EQ(kdd("build 9.9").exitCode, 1);
}

TEST_F(Archive, AddingCompletesWhatAnEarlierRunOnlyRegistered)
{
    addTwoStudies();
    save("5", anImage("5"));
    EXPECT_EQ(indexImages().number("images"), 1);
    const Answer again = addImages();
    EXPECT_EQ(again.number("unchanged"), 5);
    EXPECT_EQ(again.number("studies"), 1);
    EXPECT_EQ(imagesOf("1.2"), 4);
    EXPECT_EQ(listed("--waiting"), "");
    const QMap<QString, QByteArray> before = tagFiles();
    EXPECT_EQ(addImages().number("studies"), 0);
    EXPECT_EQ(tagFiles(), before);
    EXPECT_EQ(kdd("delete 1.2 --image 5").exitCode, 0);
    EXPECT_EQ(kdd("build 1.2 --json").number("images"), 3) << "it is deleted in the database as well";
}

TEST_F(Archive, BuildsThatAreKilledAreCompletedByTheNext)
{
    const int images = sample(120);
    indexImages();
    std::mt19937 random(7);
    for (int round = 0; round < 8; ++round) {
        const auto first = start("build --all --again --jobs 2");
        const auto second = start("build --all --jobs 2");
        first->waitForFinished(static_cast<int>(random() % 120));
        first->kill();
        first->waitForFinished(kTimeout);
        EXPECT_EQ(finish(*second).exitCode, 0);
    }
    EXPECT_EQ(kdd("build --all").exitCode, 0);
    EXPECT_EQ(listed("--waiting"), "");
    const Answer verified = kdd("verify --all --json");
    EXPECT_EQ(verified.exitCode, 0) << verified.err.toStdString();
    EXPECT_EQ(verified.number("images"), images);
}

TEST_F(Archive, BothEnginesGiveTheSameTagFiles)
{
    sample(60);
    const QStringList onServer = {QStringLiteral("--database"), QString::fromLatin1(newPostgresDatabase()),
                                  QStringLiteral("--meta"), path("server/meta")};
    EXPECT_EQ(indexImages().exitCode, 0);
    EXPECT_EQ(kdd("build --all --jobs 2").exitCode, 0);
    EXPECT_EQ(kdd("index", onServer + QStringList{images()}).exitCode, 0);
    EXPECT_EQ(kdd("build --all", onServer).exitCode, 0);
    const QMap<QString, QByteArray> files = tagFiles();
    EXPECT_GT(files.size(), 3);
    EXPECT_EQ(tagFiles("server"), files);
}

TEST_F(Archive, SeriesBecomeVolumesAndStudiesPictures)
{
    sample(60);
    const Answer added = addImages();
    EXPECT_EQ(added.exitCode, 0);
    EXPECT_EQ(added.number("volumes"), 2) << "those of the sample itself";
    const Answer stacked = kdd("stack --json");
    EXPECT_EQ(stacked.exitCode, 0) << stacked.err.toStdString();
    EXPECT_GT(stacked.number("volumes"), 0);
    EXPECT_EQ(kdd("stack --json").number("volumes"), 0) << "they have volumes already";
    EXPECT_EQ(kdd("stack --json --again").number("volumes"), stacked.number("volumes"));
    EXPECT_EQ(listed("--waiting"), "") << "what stacking left in the queue is done";
    EXPECT_EQ(stacked.out.count("\"hadVolumes\":true"), 2) << "those of the sample stay alone";
    EXPECT_EQ(kdd("verify --all").exitCode, 0);
    const Answer previews = kdd("previews --all --json --sheet @sheet.png @pictures");
    EXPECT_GT(previews.number("previews"), 10);
    EXPECT_EQ(QDir(file("pictures")).entryList(QDir::Files).size(), previews.number("previews"));
    EXPECT_GT(QImage(file("sheet.png")).width(), 300);
    EXPECT_EQ(kdd("previews --all /proc/kdd").exitCode, 1);
}

TEST_F(Archive, ADamagedFileThatWasTakenIsReadByWhateverComesLater)
{
    save("1", anImage("1"));
    save("2", anImage("2").with(DCM_PatientName, "Doe^J").withLong(DCM_TextValue, 3000));
    put("2", bytes("2").chopped(100));
    EXPECT_EQ(addImages().number("failed"), 1);
    const Answer taken = kdd("add --json --tolerant @");
    EXPECT_EQ(taken.number("failed"), 0);
    EXPECT_EQ(taken.number("images"), 2);
    EXPECT_TRUE(taken.err.contains("left out (0040,a160)")) << taken.err.toStdString();
    EXPECT_EQ(kdd("build --all --again --json").number("images"), 2);
    EXPECT_EQ(kdd("verify --all --json").out,
              "{\"differences\":0,\"images\":2,\"studies\":1,\"unreadable\":0}\n");
    EXPECT_TRUE(kdd("metadata 1.2 --image 2").out.contains("Doe^J"));
    put("2", bytes("2").chopped(100));
    EXPECT_EQ(kdd("verify --all --json").number("unreadable"), 1) << "not the file that was taken";
}

TEST_F(Archive, SlicesOfDifferentFramesOfReferenceAreStackedOnRequest)
{
    int place = 0;
    for (const char* uid : {"1", "2", "3", "4"})
        save(uid, aSlice(uid, ++place).with(DCM_FrameOfReferenceUID, uid));
    EXPECT_EQ(addImages().number("failed"), 0);
    EXPECT_TRUE(kdd("stack").out.contains("    4 left out: Its Frame of Reference")) << "told once";
    EXPECT_EQ(kdd("stack --json --ignore-frame-of-reference").number("volumes"), 1);
    EXPECT_EQ(kdd("verify --all").exitCode, 0);
}

TEST_F(Archive, SyncingKeepsWhatTheDatabaseKnows)
{
    addTwoStudies();
    const QByteArray before = kdd("metadata 1.2").out;
    EXPECT_EQ(kdd("sync 1.2 --json").number("images"), 3);
    EXPECT_EQ(kdd("metadata 1.2").out, before);
    EXPECT_EQ(kdd("verify 1.2").exitCode, 0);
    EXPECT_EQ(kdd("sync 9.9").exitCode, 1);
}

TEST_F(Archive, ADatabaseThatCannotBeUsedIsNamed)
{
    save("1", anImage("1"));
    put("no-database", QByteArray(5000, 'x'));
    for (const QString& address :
         {QStringLiteral("sqlite:/proc/none/kdd"), QStringLiteral("sqlite:") + file("no-database"),
          QStringLiteral("postgresql://nobody@127.0.0.1:1/kdd"), QStringLiteral("oracle:x")}) {
        for (const char* command : {"list", "build --all", "add @"}) {
            const Answer answer = kdd(command, QStringList{QStringLiteral("--database"), address});
            EXPECT_EQ(answer.exitCode, 1) << command << address.toStdString();
            EXPECT_TRUE(answer.err.contains(address.section(QLatin1Char(':'), 0, 0).toUtf8()));
        }
    }
    EXPECT_EQ(addImages().number("images"), 1);
}

}  // namespace
