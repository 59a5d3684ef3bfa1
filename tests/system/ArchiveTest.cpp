#include "CommandLineFixture.h"

#include <QImage>

#include <unistd.h>

#include <csignal>

using namespace Kdd;

namespace
{

/// The commands that work on a whole archive through its database.
using Archive = CommandLine;

TEST_F(Archive, WhatIsIndexedWaitsAndWhatIsBuiltDoesNot)
{
    addTwoStudies();
    QDir(path("store")).removeRecursively();
    EXPECT_EQ(kdd("index --json @").number("images"), 4);
    EXPECT_EQ(listed("--waiting"), "1.2 1.3");
    EXPECT_EQ(kdd("build 1.3 --json").number("images"), 1);
    EXPECT_EQ(listed("--waiting"), "1.2");
    EXPECT_EQ(addImages().number("studies"), 1) << "what an earlier run only registered";
    EXPECT_EQ(listed("--waiting"), "");
    QDir(path("store/meta")).removeRecursively();
    EXPECT_EQ(kdd("build --json").number("studies"), 0) << "nothing changed";
    EXPECT_EQ(kdd("build --all --json --jobs 3").number("studies"), 2) << "but their tag files are gone";
    const Answer whole = kdd("add --json", QStringList{mFolder.path()});
    EXPECT_EQ(whole.number("unchanged"), 4);
    EXPECT_EQ(whole.number("skipped"), 0) << "neither tag files nor the database";
}

const char* const kFilters[][2] = {
    {"--patient doe", "1.2"},    {"--patient P7", "1.3"},
    {"--date 20240131", "1.2"},  {"--date 20240101-", "1.2 1.3"},
    {"--date -20240201", "1.2"}, {"--date 20240201-20240301", "1.3"},
    {"--modality mr", "1.3"},    {"--modality M", ""},
    {"--waiting", "1.4"},        {"--patient doe --modality MR", ""},
};

TEST_F(Archive, ListsTheStudiesThatAreAskedFor)
{
    save("2", anImage("2").with("PatientName=Doe^J|Modality=CT|StudyDate=20240131"));
    save("3", anImage("3").inStudy("1.3").with("PatientID=P77|Modality=MR|StudyDate=20240229"));
    ASSERT_EQ(addImages().exitCode, 0);
    save("4", anImage("4").inStudy("1.4"));
    ASSERT_EQ(kdd("index @").exitCode, 0);
    for (const auto& row : kFilters)
        EXPECT_EQ(listed(row[0]), row[1]) << row[0];
}

TEST_F(Archive, IsReadByThoseWhoMayNotChangeIt)
{
    if (::geteuid() != 0)
        GTEST_SKIP() << "only root can give up the right to write";
    addTwoStudies();
    QFile(mFolder.path()).setPermissions(QFile::Permissions(0x7755));
    for (const char* command :
         {"list", "stat 1.2", "metadata 1.2", "show 1.2", "verify --all", "stack --all"}) {
        QProcess reader;
        const QString prefix =
            QStringLiteral("--reuid=65534 --regid=65534 --clear-groups " KDD_BINARY " --store ");
        const QString line = prefix + path("store") + QLatin1Char(' ') + QLatin1String(command);
        reader.start(QStringLiteral("setpriv"), line.split(QLatin1Char(' ')));
        const Answer answer = finish(reader);
        if (answer.err.contains("Permission denied") && answer.exitCode == 127)
            GTEST_SKIP() << "the tool itself cannot be reached by others here";
        EXPECT_EQ(answer.exitCode, QByteArray(command).startsWith("stack") ? 1 : 0) << line.toStdString();
    }
}

TEST_F(Archive, WhoIsInterruptedIsToldAndGoesOnFromThere)
{
    ASSERT_EQ(kdd("sample --images 120 @").exitCode, 0);
    const std::unique_ptr<QProcess> adding = start("add --json @");
    ASSERT_TRUE(adding->waitForStarted(kTimeout));
    ::kill(static_cast<pid_t>(adding->processId()), SIGINT);
    ASSERT_TRUE(adding->waitForFinished(kTimeout));
    // Before the tool has come to catching the signal, it ends the process as any other.
    const bool wasTold = adding->readAllStandardError().contains("the same command again completes the rest");
    const bool cameToItsEnd = adding->exitStatus() == QProcess::NormalExit;
    EXPECT_TRUE(!cameToItsEnd || adding->exitCode() == 0 || wasTold);
    EXPECT_EQ(addImages().exitCode, 0);
    EXPECT_EQ(kdd("verify --all --json").number("images"), 120);
    EXPECT_EQ(listed("--waiting"), "");
}

TEST_F(Archive, SeriesBecomeVolumesAndStudiesPictures)
{
    ASSERT_EQ(kdd("sample --images 60 @").exitCode, 0);
    EXPECT_EQ(addImages().number("volumes"), 2) << "those of the sample itself";
    const Answer stacked = kdd("stack --json");
    EXPECT_EQ(stacked.exitCode, 0) << stacked.err.toStdString();
    EXPECT_GT(stacked.number("volumes"), 0);
    EXPECT_EQ(kdd("stack --json").number("volumes"), 0) << "they have volumes already";
    EXPECT_EQ(kdd("stack --json --again").number("volumes"), stacked.number("volumes"));
    EXPECT_EQ(listed("--waiting"), "") << "what stacking left in the queue is done";
    EXPECT_EQ(kdd("verify --all").exitCode, 0);
    const Answer previews = kdd("previews --all --json --sheet @sheet.png @pictures");
    EXPECT_GT(previews.number("previews"), 10);
    EXPECT_EQ(QDir(file("pictures")).entryList(QDir::Files).size(), previews.number("previews"));
    EXPECT_GT(QImage(file("sheet.png")).width(), 300);
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

}  // namespace
