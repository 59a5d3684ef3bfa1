#include "CommandLineFixture.h"

#include <unistd.h>

#include <csignal>

using namespace Kdd;

namespace
{

/// How commands find their way about an archive, and how they end when they may not go on.
class ArchiveAccess : public CommandLine
{
};

const char* const kFilters[][2] = {
    {"--patient doe", "1.2"},
    {"--patient P7", "1.3"},
    {"--patient x", ""},
    {"--date 20240131", "1.2"},
    {"--date 20240101-", "1.2 1.3"},
    {"--date -20240201", "1.2"},
    {"--date 20240201-20240301", "1.3"},
    {"--modality mr", "1.3"},
    {"--modality M", ""},
    {"--waiting", "1.4"},
    {"--waiting --modality CT", ""},
    {"--patient doe --modality MR", ""},
};

TEST_F(ArchiveAccess, ListsTheStudiesThatAreAskedFor)
{
    save(
        "1",
        anImage("1").with(DCM_PatientName, "Doe^J").with(DCM_StudyDate, "20240131").with(DCM_Modality, "CT"));
    save("2", anImage("2")
                  .inStudy("1.3")
                  .inSeries("1.3.1")
                  .with(DCM_PatientID, "P77")
                  .with(DCM_StudyDate, "20240229")
                  .with(DCM_Modality, "MR"));
    ASSERT_EQ(addImages().exitCode, 0);
    save("3", anImage("3").inStudy("1.4").inSeries("1.4.1"));
    ASSERT_EQ(kdd("index @").exitCode, 0);
    for (const auto& row : kFilters)
        EXPECT_EQ(listed(row[0]), row[1]) << row[0];
}

TEST_F(ArchiveAccess, PassesOverWhatTheArchiveKeepsItself)
{
    addTwoStudies();
    const Answer whole = kdd("add --json", QStringList{mFolder.path()});
    EXPECT_EQ(whole.exitCode, 0) << whole.err.toStdString();
    EXPECT_EQ(whole.number("unchanged"), 4);
    EXPECT_EQ(whole.number("skipped"), 0) << "neither tag files nor the database";
}

TEST_F(ArchiveAccess, ReadsAStoreThatItMayNotChange)
{
    if (::geteuid() != 0)
        GTEST_SKIP() << "only root can give up the right to write";
    addTwoStudies();
    QFile(mFolder.path()).setPermissions(QFile::Permissions(0x7755));
    for (const char* command :
         {"list", "stat 1.2", "metadata 1.2", "show 1.2", "verify --all", "stack --all"}) {
        QProcess reader;
        reader.start(QStringLiteral("setpriv"),
                     QStringList{QStringLiteral("--reuid=65534"), QStringLiteral("--regid=65534"),
                                 QStringLiteral("--clear-groups"), QStringLiteral(KDD_BINARY),
                                 QStringLiteral("--store"), path("store")} +
                         QString::fromLatin1(command).split(QLatin1Char(' ')));
        ASSERT_TRUE(reader.waitForFinished(kTimeout));
        const QByteArray said = reader.readAllStandardError();
        if (said.contains("Permission denied") && reader.exitCode() == 127)
            GTEST_SKIP() << "the tool itself cannot be reached by others here";
        const bool changes = QByteArray(command).startsWith("stack");
        EXPECT_EQ(reader.exitCode(), changes ? 1 : 0) << command << '\n' << said.toStdString();
    }
}

TEST_F(ArchiveAccess, WhoIsInterruptedIsToldAndGoesOnFromThere)
{
    ASSERT_EQ(kdd("sample --images 120 @").exitCode, 0);
    const std::unique_ptr<Process> adding = start("add --json @");
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

}  // namespace
