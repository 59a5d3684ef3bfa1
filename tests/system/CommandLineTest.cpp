#include "CommandLineFixture.h"
#include "support/Process.h"
#include "support/RealFiles.h"

#include <cstdio>
#include <fstream>

using namespace Kdd;

namespace
{

TEST_F(CommandLine, TellsWhatItHolds)
{
    addTwoStudies();
    EXPECT_EQ(listed(), "1.2 1.3");
    const Answer stat = kdd("stat 1.2 --json");
    EXPECT_EQ(stat.number("series"), 2);
    EXPECT_EQ(stat.number("images"), 3);
    EXPECT_EQ(stat.number("storedSize"), stat.number("fileSize"));
    EXPECT_TRUE(kdd("show 1.2 --image 3").out.contains("Doe^J"));
    EXPECT_FALSE(kdd("show 1.2 --image 3 --own").out.contains("Doe^J"));
    EXPECT_EQ(kdd("show 1.2 --series 1.2.3 --image 3").exitCode, 1);
    EXPECT_EQ(QJsonDocument::fromJson(kdd("metadata 1.2").out).array().size(), 3);
    EXPECT_TRUE(kdd("metadata 1.2 --image 1").out.contains("\"0040A160\":{\"vr\":\"UT\",\"BulkDataURI\":"));
}

TEST_F(CommandLine, TellsWhereTheBytesOfTagFilesGo)
{
    addTwoStudies();
    const int sizes[] = {kdd("stat 1.2 --json").number("fileSize"),
                         kdd("stat 1.3 --json").number("fileSize")};
    for (const auto& [studies, size] : {std::pair("1.2", sizes[0]), std::pair("", sizes[0] + sizes[1])}) {
        const Answer answer = kdd("stat --bytes --json " + QByteArray(studies));
        int sum = 0;
        for (const QJsonValue& part : answer.json("parts").toArray())
            sum += jsonAt(part, "after").toInt();
        EXPECT_EQ(sum, size);
        EXPECT_EQ(answer.number("after"), size);
    }
    const Answer first = kdd("stat --bytes 1.2 --json");
    const int listed = first.json("attributes").toArray().size();
    EXPECT_EQ(listed + first.number("notListed"),
              kdd("stat --bytes 1.2 --all --json").json("attributes").toArray().size());
    EXPECT_TRUE(kdd("stat --bytes").out.contains("(0008,0018)  SOPInstanceUID"));
    for (const char* wrong : {"stat", "stat 1.2 1.3", "stat 1.2 --all"})
        EXPECT_EQ(kdd(wrong).exitCode, 2) << wrong;
    EXPECT_EQ(kdd("stat --bytes 9").exitCode, 1);
}

TEST_F(CommandLine, CountsWhatItCannotTakeAndGoesOn)
{
    addTwoStudies();
    put("empty", "");
    put("cut-short", bytes("1").left(bytes("1").size() / 3));
    put("cut-in-meta", bytes("1").left(150));
    put("letter.txt", "Dear colleague, the patient's Study Instance UID is");
    put("zeros", QByteArray(2000, '\0'));
    QFile::link(QStringLiteral("gone"), file("vanished"));
    QFile::link(QStringLiteral("loop"), file("loop"));
    const Answer answer = kdd("add --json @ @nowhere");
    EXPECT_EQ(answer.exitCode, 1);
    EXPECT_EQ(answer.number("failed"), 6);
    EXPECT_EQ(answer.number("skipped"), 2);
    EXPECT_EQ(answer.number("unchanged"), 4);
    EXPECT_EQ(answer.json("failures").toArray().size(), 6);
    for (const char* name : {"/empty", "/cut-short", "/cut-in-meta", "/vanished", "/loop", "/nowhere"})
        EXPECT_TRUE(answer.err.contains(name)) << name;
    EXPECT_EQ(kdd("verify --all").exitCode, 0);
}

TEST_F(CommandLine, TakesFilesWhateverTheirNames)
{
    save("plain", anImage("1"));
    for (const char* name : {"B\303\244r", "line\nbreak", "-dash", "back\\slash"})
        put(name, bytes("plain"));
    EXPECT_EQ(addImages().exitCode, 0);
    EXPECT_EQ(kdd("verify --all").exitCode, 0);
    // A name that is no UTF-8 may be taken or refused, but not be passed over.
    const QByteArray image = bytes("plain");
    QDir(images()).removeRecursively();
    QDir().mkpath(images());
    const std::string foreign = images().toStdString() + "/B\344r";
    std::ofstream(foreign, std::ios::binary).write(image.constData(), image.size());
    const Answer answer = addImages();
    EXPECT_EQ(answer.number("images") + answer.number("failed"), 1);
    std::remove(foreign.c_str());
}

TEST_F(CommandLine, RefusesUidsThatAreATrap)
{
    save("a", anImage("1/../2"));
    save("b", anImage("1").inStudy("1.2\033[31m"));
    save("c", anImage("1").inSeries("a\\b"));
    save("d", anImage("1").inStudy("\344"));
    const Answer answer = addImages();
    EXPECT_EQ(answer.exitCode, 1);
    EXPECT_EQ(answer.number("failed"), 4);
    EXPECT_EQ(listed(), "");
}

TEST_F(CommandLine, NeverSendsControlCharactersToTheTerminal)
{
    save("1", anImage("1").with("PatientName=Doe\033[31m|SeriesDescription=\233\r"));
    addImages();
    for (const char* command :
         {"list", "show 1.2", "show 1.2 --own", "show 1.2 --tree", "list --json", "metadata 1.2"}) {
        const Answer answer = kdd(command);
        EXPECT_EQ(answer.exitCode, 0);
        EXPECT_FALSE(answer.out.contains('\033') || answer.out.contains('\r')) << command;
    }
}

TEST_F(CommandLine, AFullDiskLosesNothingThatWasThere)
{
    addTwoStudies();
    QDir(images()).removeRecursively();
    for (const char* uid : {"10", "11", "12", "13", "14"})
        save(uid, anImage(uid).with(DCM_ImageComments, uid));
    const int size = kdd("stat 1.2 --json").number("fileSize");
    const Answer full = [&] {
        const FullDisk disk(size);
        return addImages();
    }();
    EXPECT_EQ(full.exitCode, 1);
    EXPECT_FALSE(full.err.isEmpty());
    EXPECT_EQ(imagesOf("1.2"), 3);
    EXPECT_EQ(addImages().exitCode, 0);
    EXPECT_EQ(imagesOf("1.2"), 8);
}

TEST_F(CommandLine, OutputThatCannotBeWrittenIsAFailure)
{
    addTwoStudies();
    for (const char* command :
         {"list", "list --json", "show 1.2", "stat 1.2", "metadata 1.2", "verify --all"}) {
        const auto process = start(command);
        finish(*process);
        process->setStandardOutputFile(QStringLiteral("/dev/full"));
        process->start();
        EXPECT_EQ(finish(*process).exitCode, 1) << command;
    }
}

TEST_F(CommandLine, AUniqueBeginningNamesAStudy)
{
    for (const char* uid : {"1.2.1", "1.2.10", "1.2.11", "1.3.6"})
        save(uid, anImage("1").inStudy(uid));
    addImages();
    for (const auto& [text, study] : {std::pair("1.2.10", "1.2.10"), {"1.2.1", "1.2.1"}, {"1.3", "1.3.6"}})
        EXPECT_EQ(textAt(kdd("metadata " + QByteArray(text)).out, "0/0020000D/Value/0"), study);
    for (const char* text : {"1.2", "9", ""})
        EXPECT_EQ(kdd("metadata", QStringList{QLatin1String(text)}).exitCode, 1) << text;
}

TEST_F(CommandLine, WrongUsageIsToldFromFailure)
{
    for (const char* arguments : {"", "frobnicate", "add", "verify", "verify --all 1.2", "build --again",
                                  "--compression zip list", "list --no-such", "qa job.xml --image 1"})
        EXPECT_EQ(kdd(arguments).exitCode, 2) << arguments;
    for (const char* command : {"list", "verify --all", "build --all", "stack", "previews --all pictures"})
        EXPECT_TRUE(kdd(command).err.contains("kdd.sqlite")) << command;
    EXPECT_FALSE(QDir(path("store")).exists()) << "nobody asked for one";
    QDir().mkpath(images());
    EXPECT_EQ(addImages().exitCode, 0);
    EXPECT_EQ(kdd("list --json").out, "{\"studies\":[]}\n") << "an empty store is no fault";
}

TEST_F(CommandLine, DiffNamesEachDifference)
{
    addTwoStudies();
    save("other", anImage("1").with(DCM_PatientName, "Roe^R").withLong(DCM_TextValue, 3000));
    EXPECT_EQ(kdd("diff @1 @1").exitCode, 0);
    const Answer answer = kdd("diff --json @1 @other");
    EXPECT_EQ(answer.exitCode, 1);
    ASSERT_EQ(answer.json("differences").toArray().size(), 1);
    EXPECT_TRUE(answer.out.contains("\"name\":\"PatientName\""));
    EXPECT_EQ(kdd("diff 1.2 1.3 --json").json("differences").toArray().size(), 4);
}

TEST_F(CommandLine, DeletesWhatIsNamedAndNothingElse)
{
    addTwoStudies();
    EXPECT_EQ(kdd("delete 1.2 --series 1.2.3 --image 3").exitCode, 1);
    EXPECT_EQ(kdd("delete", QStringList{QString()}).exitCode, 1) << "an unset variable of a script";
    EXPECT_EQ(imagesOf("1.2"), 3);
    EXPECT_EQ(kdd("delete 1.2 --image 3 --json").out, "{\"deleted\":1}\n");
    EXPECT_EQ(kdd("delete 1.2 --series 1.2.3").exitCode, 0);
    EXPECT_EQ(imagesOf("1.2"), 1);
}

TEST_F(CommandLine, SampleStudiesAreTheSameToTheLastByteHoweverManyAreAskedFor)
{
    for (const char* command : {"sample --images 60 @a", "sample --images 60 @b", "sample --images 90 @c"})
        EXPECT_EQ(kdd(command).exitCode, 0);
    for (const char* other : {"b", "c"}) {
        const QString compare = QStringLiteral("diff -rq -x '*.vol' %1 %2 2>&1 | grep -v '^Only in %2'")
                                    .arg(file("a"), file(other));
        EXPECT_EQ(QProcess::execute(QStringLiteral("sh"), {QStringLiteral("-c"), compare}), 1) << other;
    }
}

class RealFiles : public CommandLine
{
protected:
    void SetUp() override
    {
        if (realFilesFolder().isEmpty())
            GTEST_SKIP() << "KDD_TEST_DATA names no folder of real DICOM files";
    }
};

TEST_F(RealFiles, ComeThroughUnchanged)
{
    QStringList folders;
    for (const char* name : {"/series", "/multiframe", "/modalities", "/charsets"})
        folders.append(realFilesFolder() + QLatin1String(name));
    const Answer added = kdd("add --json", folders);
    // Palettes and hanging protocols belong to no study.
    EXPECT_GT(added.number("failed"), 0);
    for (const QJsonValue& failure : added.json("failures").toArray())
        EXPECT_EQ(textAt(failure, "reason"), "It has no Study Instance UID");
    EXPECT_GT(added.number("images"), 700);
    const Answer verified = kdd("verify --all --json");
    EXPECT_EQ(verified.exitCode, 0) << verified.err.toStdString();
    EXPECT_EQ(verified.number("images"), added.number("images"));
}

TEST_F(RealFiles, ThatAreOddEndNoProcess)
{
    for (const QString& odd : realFiles("odd"))
        EXPECT_LE(kdd("add --json", QStringList{odd}).exitCode, 1) << odd.toStdString();
    EXPECT_EQ(kdd("verify --all").exitCode, 0);
    EXPECT_EQ(kdd("list").exitCode, 0);
}

}  // namespace
