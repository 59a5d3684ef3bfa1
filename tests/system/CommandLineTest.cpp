#include "support/DatasetBuilder.h"
#include "support/RealFiles.h"

#include <QDir>
#include <QFile>
#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QProcess>
#include <QTemporaryDir>

#include <gtest/gtest.h>
#include <sys/resource.h>
#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <cstdio>
#include <fstream>
#include <memory>
#include <vector>

using namespace Kdd;

namespace
{

constexpr int kTimeout = 120000;  // [ms]
constexpr qint64 kNoLimit = -1;

/// The tool as a process, whose files may be kept from growing as by a full disk.
class Process : public QProcess
{
public:
    explicit Process(qint64 largestFile)
        : mLargestFile(largestFile)
    {
    }

protected:
    void setupChildProcess() override
    {
        if (mLargestFile == kNoLimit)
            return;
        ::signal(SIGXFSZ, SIG_IGN);
        const rlimit limit = {static_cast<rlim_t>(mLargestFile), static_cast<rlim_t>(mLargestFile)};
        ::setrlimit(RLIMIT_FSIZE, &limit);
    }

private:
    qint64 mLargestFile;
};

struct Answer
{
    int exitCode = -1;
    QByteArray out;
    QByteArray err;

    QJsonObject json() const { return QJsonDocument::fromJson(out).object(); }
    int number(const char* key) const { return json().value(QLatin1String(key)).toInt(-1); }
};

class CommandLine : public testing::Test
{
protected:
    void SetUp() override { ASSERT_TRUE(mFolder.isValid()); }

    QString path(const QString& name) const { return mFolder.filePath(name); }
    QString store() const { return path(QStringLiteral("store")); }
    QString images() const { return path(QStringLiteral("images")); }

    /// Arguments are separated by blanks; `more` follows.
    std::unique_ptr<Process> start(const char* arguments, const QStringList& more = {},
                                   qint64 largestFile = kNoLimit, const char* output = nullptr) const
    {
        auto process = std::make_unique<Process>(largestFile);
        if (output != nullptr)
            process->setStandardOutputFile(QString::fromLatin1(output));
        const QStringList global{QStringLiteral("--store"), store()};
        process->start(QStringLiteral(KDD_BINARY),
                       global + QString::fromLatin1(arguments).split(QLatin1Char(' '), Qt::SkipEmptyParts) +
                           more);
        return process;
    }

    static Answer finish(Process& process)
    {
        Answer answer;
        EXPECT_TRUE(process.waitForFinished(kTimeout)) << process.errorString().toStdString();
        EXPECT_EQ(process.exitStatus(), QProcess::NormalExit);
        answer = {process.exitCode(), process.readAllStandardOutput(), process.readAllStandardError()};
        EXPECT_FALSE(answer.err.contains("Sanitizer") || answer.err.contains("runtime error"))
            << answer.err.toStdString();
        return answer;
    }

    template <typename... Arguments>
    Answer kdd(Arguments... arguments) const
    {
        return finish(*start(arguments...));
    }

    Answer addImages(qint64 largestFile = kNoLimit) const
    {
        return kdd("add --json", QStringList{images()}, largestFile);
    }

    void put(const QString& name, const QByteArray& content) const
    {
        QDir().mkpath(images());
        QFile file(images() + QLatin1Char('/') + name);
        ASSERT_TRUE(file.open(QIODevice::WriteOnly));
        ASSERT_EQ(file.write(content), content.size());
    }

    QString save(const char* name, const DatasetBuilder& image) const
    {
        QDir().mkpath(images());
        const QString file = images() + QLatin1Char('/') + QString::fromUtf8(name);
        DcmFileFormat format(&image.dataset());
        EXPECT_TRUE(format.saveFile(file.toUtf8().constData(), EXS_LittleEndianExplicit).good());
        return file;
    }

    /// Two series of study 1.2 with images 1 and 2, 3; study 1.3 with image 4.
    void saveTwoStudies() const
    {
        save("1", anImage("1").with(DCM_PatientName, "Doe^J").withLong(DCM_TextValue, 3000));
        save("2", anImage("2").inSeries("1.2.4").with(DCM_PatientName, "Doe^J"));
        save("3", anImage("3").inSeries("1.2.4").with(DCM_PatientName, "Doe^J").with(DCM_Modality, "MR"));
        save("4", anImage("4").inStudy("1.3").inSeries("1.3.1"));
    }

    QList<QString> listedStudies() const
    {
        QList<QString> uids;
        for (const QJsonValue& study : kdd("list --json").json().value(QLatin1String("studies")).toArray())
            uids.append(study.toObject().value(QLatin1String("study")).toString());
        std::sort(uids.begin(), uids.end());
        return uids;
    }

    QTemporaryDir mFolder;
};

const QString kFirst = QStringLiteral("1.2");
const QString kSecond = QStringLiteral("1.3");

TEST_F(CommandLine, AddsStudiesAndTellsWhatItHolds)
{
    saveTwoStudies();
    const Answer added = addImages();
    EXPECT_EQ(added.exitCode, 0);
    EXPECT_EQ(added.out,
              "{\"failed\":0,\"images\":4,\"series\":3,\"skipped\":0,\"studies\":2,\"volumes\":0}\n");
    EXPECT_EQ(listedStudies(), (QList<QString>{kFirst, kSecond}));
    const Answer stat = kdd("stat 1.2 --json");
    EXPECT_EQ(stat.number("series"), 2);
    EXPECT_EQ(stat.number("images"), 3);
    EXPECT_EQ(stat.number("storedSize"), stat.number("fileSize"));
    EXPECT_TRUE(kdd("show 1.2 --image 3").out.contains("Doe^J"));
    EXPECT_FALSE(kdd("show 1.2 --image 3 --own").out.contains("Doe^J"));
    EXPECT_EQ(kdd("show 1.2 --tree --verbose").out.count("image "), 3);
    EXPECT_EQ(kdd("show 1.2 --series 1.2.3 --image 3").exitCode, 1);
    EXPECT_EQ(kdd("verify --all --json").out,
              "{\"differences\":0,\"images\":4,\"studies\":2,\"unreadable\":0}\n");
}

TEST_F(CommandLine, WritesMetadataAsJson)
{
    saveTwoStudies();
    addImages();
    const QJsonArray all = QJsonDocument::fromJson(kdd("metadata 1.2").out).array();
    EXPECT_EQ(all.size(), 3);
    const QJsonArray one = QJsonDocument::fromJson(kdd("metadata 1.2 --image 1").out).array();
    ASSERT_EQ(one.size(), 1);
    const QJsonObject image = one.at(0).toObject();
    EXPECT_EQ(image.value(QLatin1String("00080018")),
              QJsonObject({{QStringLiteral("vr"), QStringLiteral("UI")},
                           {QStringLiteral("Value"), QJsonArray{QStringLiteral("1")}}}));
    EXPECT_TRUE(image.value(QLatin1String("0040A160")).toObject().contains(QLatin1String("BulkDataURI")));
}

TEST_F(CommandLine, AddingAgainAndInPiecesGivesTheSame)
{
    saveTwoStudies();
    addImages();
    EXPECT_EQ(addImages().exitCode, 0);
    EXPECT_EQ(kdd("stat 1.2 --json").number("images"), 3);
    save("2", anImage("2").inSeries("1.2.4").with(DCM_PatientName, "Doe^Jane"));
    save("5", anImage("5").with(DCM_PatientName, "Doe^J"));
    EXPECT_EQ(kdd("add --json --compression lzma",
                  QStringList{images() + QStringLiteral("/2"), images() + QStringLiteral("/5")})
                  .number("images"),
              4);
    EXPECT_EQ(kdd("verify --all --json").out,
              "{\"differences\":0,\"images\":5,\"studies\":2,\"unreadable\":0}\n");
}

TEST_F(CommandLine, ProcessesThatAddToOneStudyAtOnceLoseNothing)
{
    std::vector<std::unique_ptr<Process>> processes;
    for (int i = 1; i <= 6; ++i)
        save(QByteArray::number(i).constData(), anImage(QByteArray::number(i).constData()));
    for (int i = 1; i <= 6; ++i)
        processes.push_back(start("add", {images() + QLatin1Char('/') + QString::number(i)}));
    for (const auto& process : processes)
        EXPECT_EQ(finish(*process).exitCode, 0);
    EXPECT_EQ(kdd("verify --all --json").number("images"), 6);
}

TEST_F(CommandLine, CountsWhatItCannotTakeAndGoesOn)
{
    saveTwoStudies();
    QFile good(images() + QStringLiteral("/1"));
    ASSERT_TRUE(good.open(QIODevice::ReadOnly));
    const QByteArray bytes = good.readAll();
    put(QStringLiteral("empty"), "");
    put(QStringLiteral("cut-short"), bytes.left(bytes.size() / 3));
    put(QStringLiteral("cut-in-meta"), bytes.left(150));
    put(QStringLiteral("letter.txt"), "Dear colleague, the patient's Study Instance UID is");
    put(QStringLiteral("zeros"), QByteArray(2000, '\0'));
    QFile::link(QStringLiteral("gone"), images() + QStringLiteral("/vanished"));
    QFile::link(QStringLiteral("loop"), images() + QStringLiteral("/loop"));
    const Answer answer = kdd("add --json", QStringList{images(), path(QStringLiteral("nowhere"))});
    EXPECT_EQ(answer.exitCode, 1);
    EXPECT_EQ(answer.out,
              "{\"failed\":6,\"images\":4,\"series\":3,\"skipped\":2,\"studies\":2,\"volumes\":0}\n");
    for (const char* name : {"/empty", "/cut-short", "/cut-in-meta", "/vanished", "/loop", "/nowhere"})
        EXPECT_TRUE(answer.err.contains(name)) << name;
    EXPECT_FALSE(answer.err.contains("letter.txt"));
    EXPECT_TRUE(kdd("add --verbose", QStringList{images()}).err.contains("letter.txt"));
    EXPECT_EQ(kdd("verify --all").exitCode, 0);
}

TEST_F(CommandLine, TakesFilesWhateverTheirNames)
{
    const QString folder = images();
    const QByteArray bytes = [&] {
        QFile file(save("plain", anImage("1")));
        return file.open(QIODevice::ReadOnly) ? file.readAll() : QByteArray();
    }();
    const char* const names[] = {"B\303\244r", "line\nbreak", "-dash", "back\\slash"};
    for (const char* name : names)
        put(QString::fromUtf8(name), bytes);
    EXPECT_EQ(addImages().exitCode, 0);
    EXPECT_EQ(kdd("verify --all").exitCode, 0);
    // A name that is no UTF-8 may be taken or refused, but not be passed over.
    QDir(folder).removeRecursively();
    QDir().mkpath(folder);
    const std::string foreign = folder.toStdString() + "/B\344r";
    std::ofstream(foreign, std::ios::binary).write(bytes.constData(), bytes.size());
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
    EXPECT_EQ(answer.number("images"), 0);
    EXPECT_TRUE(listedStudies().isEmpty());
}

TEST_F(CommandLine, NeverSendsControlCharactersToTheTerminal)
{
    save("1", anImage("1").with(DCM_PatientName, "Doe\033[31m").with(DCM_SeriesDescription, "\233\r"));
    addImages();
    for (const char* command :
         {"list", "show 1.2", "show 1.2 --own", "show 1.2 --tree", "list --json", "metadata 1.2"}) {
        const Answer answer = kdd(command);
        EXPECT_EQ(answer.exitCode, 0);
        EXPECT_FALSE(answer.out.contains('\033') || answer.out.contains('\r')) << command;
    }
}

TEST_F(CommandLine, SaysThatTheStoreCannotBeWritten)
{
    saveTwoStudies();
    put(QStringLiteral("../file"), "");
    for (const QString& meta : {QStringLiteral("/proc/kdd"), path(QStringLiteral("file"))}) {
        const Answer answer = kdd("add --json", QStringList{QStringLiteral("--meta"), meta, images()});
        EXPECT_EQ(answer.exitCode, 1);
        EXPECT_EQ(answer.out,
                  "{\"failed\":4,\"images\":0,\"series\":0,\"skipped\":0,\"studies\":0,\"volumes\":0}\n");
        EXPECT_TRUE(answer.err.contains(meta.toUtf8()));
    }
}

TEST_F(CommandLine, AFullDiskLosesNothingThatWasThere)
{
    saveTwoStudies();
    ASSERT_EQ(addImages().exitCode, 0);
    QDir(images()).removeRecursively();
    for (int i = 10; i < 15; ++i)
        save(QByteArray::number(i).constData(), anImage(QByteArray::number(i).constData())
                                                    .with(DCM_ImageComments, QByteArray::number(i * 12345)));
    const Answer full = addImages(kdd("stat 1.2 --json").number("fileSize"));
    EXPECT_EQ(full.exitCode, 1);
    EXPECT_EQ(full.number("failed"), 5);
    EXPECT_FALSE(full.err.isEmpty());
    EXPECT_EQ(kdd("stat 1.2 --json").number("images"), 3);
    EXPECT_EQ(addImages().exitCode, 0);
    EXPECT_EQ(kdd("stat 1.2 --json").number("images"), 8);
}

TEST_F(CommandLine, OutputThatCannotBeWrittenIsAFailure)
{
    saveTwoStudies();
    addImages();
    for (const char* command :
         {"list", "list --json", "show 1.2", "stat 1.2", "metadata 1.2", "verify --all"})
        EXPECT_EQ(finish(*start(command, {}, kNoLimit, "/dev/full")).exitCode, 1) << command;
}

struct Prefix
{
    const char* text;
    const char* study;  // null: none, or several
};

const Prefix kPrefixes[] = {
    {"1.2.10", "1.2.10"}, {"1.2.1", "1.2.1"}, {"1.2.11", "1.2.11"}, {"1.3", "1.3.6"},
    {"1.2", nullptr},     {"9", nullptr},     {"", nullptr},
};

TEST_F(CommandLine, AUniqueBeginningNamesAStudy)
{
    for (const char* uid : {"1.2.1", "1.2.10", "1.2.11", "1.3.6"})
        save(uid, anImage("1").inStudy(uid));
    addImages();
    for (const Prefix& row : kPrefixes) {
        const Answer answer = kdd("metadata", QStringList{QString::fromLatin1(row.text)});
        EXPECT_EQ(answer.exitCode, row.study != nullptr ? 0 : 1) << row.text;
        EXPECT_EQ(answer.err.isEmpty(), row.study != nullptr);
        EXPECT_TRUE(row.study == nullptr || answer.out.contains('"' + QByteArray(row.study) + '"'));
    }
}

TEST_F(CommandLine, NothingNamesNoStudyEvenIfThereIsOnlyOne)
{
    save("1", anImage("1"));
    addImages();
    EXPECT_EQ(kdd("delete", QStringList{QString()}).exitCode, 1) << "an unset variable of a script";
    EXPECT_EQ(listedStudies(), QList<QString>{kFirst});
}

TEST_F(CommandLine, WrongUsageIsToldFromFailure)
{
    for (const char* arguments : {"", "frobnicate", "add", "show", "verify", "verify --all 1.2",
                                  "--compression zip list", "list --no-such-option"}) {
        const Answer answer = kdd(arguments);
        EXPECT_EQ(answer.exitCode, 2) << arguments;
        EXPECT_FALSE(answer.err.isEmpty()) << arguments;
    }
    EXPECT_EQ(kdd("--version").exitCode, 0);
    EXPECT_TRUE(kdd("add --help").out.contains("PATH"));
    EXPECT_EQ(kdd("list --json").out, "{\"studies\":[]}\n") << "an empty store is no fault";
}

TEST_F(CommandLine, DiffNamesEachDifference)
{
    saveTwoStudies();
    addImages();
    const QString one = images() + QStringLiteral("/1");
    const QString other =
        save("other", anImage("1").with(DCM_PatientName, "Roe^R").withLong(DCM_TextValue, 3000));
    EXPECT_EQ(kdd("diff", QStringList{one, one}).exitCode, 0);
    const Answer answer = kdd("diff --json", QStringList{one, other});
    EXPECT_EQ(answer.exitCode, 1);
    const QJsonArray differences = answer.json().value(QLatin1String("differences")).toArray();
    ASSERT_EQ(differences.size(), 1);
    EXPECT_EQ(differences.at(0).toObject().value(QLatin1String("name")).toString(),
              QStringLiteral("PatientName"));
    EXPECT_EQ(kdd("diff 1.2 1.2").exitCode, 0);
    EXPECT_EQ(kdd("diff 1.2 1.3 --json").json().value(QLatin1String("differences")).toArray().size(), 4);
    EXPECT_EQ(kdd("diff 1.2", QStringList{path(QStringLiteral("nowhere"))}).exitCode, 1);
}

TEST_F(CommandLine, VerifyNoticesWhatChangedOnDisk)
{
    saveTwoStudies();
    addImages();
    save("2", anImage("2").inSeries("1.2.4").with(DCM_PatientName, "Roe^R"));
    QFile::remove(images() + QStringLiteral("/4"));
    const Answer answer = kdd("verify --all --json");
    EXPECT_EQ(answer.exitCode, 1);
    EXPECT_EQ(answer.out, "{\"differences\":1,\"images\":3,\"studies\":2,\"unreadable\":1}\n");
    EXPECT_TRUE(answer.err.contains("(0010,0010)"));
    EXPECT_TRUE(answer.err.contains("/images/4"));
}

TEST_F(CommandLine, DeletesWhatIsNamedAndNothingElse)
{
    saveTwoStudies();
    addImages();
    for (const char* command :
         {"delete 1.2 --image 9", "delete 1.2 --series 9", "delete 9", "delete 1.2 --series 1.2.3 --image 3"})
        EXPECT_EQ(kdd(command).exitCode, 1) << command;
    EXPECT_EQ(kdd("stat 1.2 --json").number("images"), 3);
    EXPECT_EQ(kdd("delete 1.2 --image 3 --json").out, "{\"deleted\":1}\n");
    EXPECT_EQ(kdd("delete 1.2 --series 1.2.3").exitCode, 0);
    EXPECT_EQ(kdd("stat 1.2 --json").number("images"), 1);
    EXPECT_EQ(kdd("delete 1.2 --image 2").exitCode, 0);
    EXPECT_EQ(listedStudies(), QList<QString>{kSecond});
    EXPECT_EQ(kdd("delete 1.3").exitCode, 0);
    EXPECT_TRUE(listedStudies().isEmpty());
}

TEST_F(CommandLine, ADamagedTagFileIsNamedAndTheOthersAreListed)
{
    saveTwoStudies();
    addImages();
    put(QStringLiteral("../store/meta/damaged.tc"), "TaCa");
    const Answer answer = kdd("list --json");
    EXPECT_EQ(answer.exitCode, 1);
    EXPECT_TRUE(answer.err.contains("damaged.tc"));
    EXPECT_EQ(listedStudies().size(), 2);
    EXPECT_EQ(kdd("verify --all").exitCode, 1);
}

TEST_F(CommandLine, SampleStudiesComeThroughUnchanged)
{
    ASSERT_EQ(kdd("sample --images 40", QStringList{images()}).exitCode, 0);
    const Answer added = addImages();
    EXPECT_EQ(added.number("images"), 40);
    EXPECT_EQ(added.number("failed"), 0);
    EXPECT_EQ(kdd("verify --all --json").number("images"), 40);
    EXPECT_EQ(kdd("verify --all").exitCode, 0);
}

TEST_F(CommandLine, RealStudiesComeThroughUnchanged)
{
    if (realFilesFolder().isEmpty())
        GTEST_SKIP() << "KDD_TEST_DATA names no folder of real DICOM files";
    const Answer added = kdd("add --json", QStringList{realFilesFolder() + QStringLiteral("/series"),
                                                       realFilesFolder() + QStringLiteral("/multiframe"),
                                                       realFilesFolder() + QStringLiteral("/modalities"),
                                                       realFilesFolder() + QStringLiteral("/charsets")});
    EXPECT_EQ(added.exitCode, 0) << added.err.toStdString();
    const Answer verified = kdd("verify --all --json");
    EXPECT_EQ(verified.exitCode, 0) << verified.err.toStdString();
    EXPECT_EQ(verified.number("images"), added.number("images"));
    EXPECT_GT(added.number("images"), 700);
}

TEST_F(CommandLine, OddFilesEndNoProcess)
{
    if (realFilesFolder().isEmpty())
        GTEST_SKIP() << "KDD_TEST_DATA names no folder of real DICOM files";
    for (const QString& file : realFiles("odd"))
        EXPECT_LE(kdd("add --json", QStringList{file}).exitCode, 1) << file.toStdString();
    EXPECT_EQ(kdd("verify --all").exitCode, 0);
    EXPECT_EQ(kdd("list").exitCode, 0);
}

}  // namespace
