#include "CommandLineFixture.h"
#include "support/RealFiles.h"
#include "support/Setting.h"

#include <QFileInfo>

using namespace Kdd;

namespace
{

/// The tool and the library as they would be installed, but without any module.
class BareTool : public CommandLine
{
protected:
    void SetUp() override
    {
        QDir().mkpath(path("bare"));
        for (const char* file : {KDD_BINARY, KDD_LIBRARY}) {
            const QString name = QFileInfo(QString::fromUtf8(file)).fileName();
            ASSERT_TRUE(QFile::copy(QString::fromUtf8(file), path("bare/") + name));
        }
        addTwoStudies();
    }

    Answer run(const char* arguments) const
    {
        QProcess process;
        QProcessEnvironment environment = QProcessEnvironment::systemEnvironment();
        environment.insert(QStringLiteral("LD_LIBRARY_PATH"), path("bare"));
        process.setProcessEnvironment(environment);
        QStringList words =
            QString::fromLatin1(arguments).replace(QLatin1Char('@'), images()).split(QLatin1Char(' '));
        process.start(path("bare/kdd"), QStringList{QStringLiteral("--store"), path("store")} + words);
        return finish(process);
    }
};

/// With the exit code and the module that is missed.
const std::tuple<const char*, int, const char*> kUses[] = {
    {"--version", 0, ""},
    {"stat 1.2 --json", 0, ""},
    {"metadata 1.2", 0, ""},
    {"show 1.2 --tree", 0, ""},
    {"list", 1, "kdd-database.so"},
    {"get http://127.0.0.1:9/a", 1, "kdd-curl.so"},
    {"receive 0", 1, "kdd-tool.so"},
};

TEST_F(BareTool, ReadsTagFilesAndNamesWhatElseIsMissing)
{
    for (const auto& [arguments, exitCode, module] : kUses) {
        const Answer answer = run(arguments);
        EXPECT_EQ(answer.exitCode, exitCode) << arguments << '\n' << answer.err.toStdString();
        EXPECT_TRUE(answer.err.contains(module)) << arguments << '\n' << answer.err.toStdString();
        EXPECT_EQ(answer.err.contains("is not installed in"), exitCode != 0) << arguments;
    }
}

TEST_F(BareTool, TakesImagesWithoutTheirPictures)
{
    const QString module = QStringLiteral("/kddlib/kdd-database.so");
    QDir().mkpath(path("bare/kddlib"));
    ASSERT_TRUE(QFile::copy(QStringLiteral(KDD_BUILD_FOLDER) + module, path("bare") + module));
    save("5", anImage("5").inStudy("1.4").asPicture(2, 2, 8).bytes({0, 1, 2, 3}));
    const Answer answer = run("add --json @");
    EXPECT_EQ(answer.exitCode, 0);
    EXPECT_EQ(answer.number("images"), 1);
    EXPECT_TRUE(answer.err.contains("kdd-pictures.so is not installed in")) << answer.err.toStdString();
    EXPECT_EQ(imagesOf("1.4"), 1);
}

TEST_F(BareTool, DecodesNothingWhereThereIsNoDecoder)
{
    if (realFilesFolder().isEmpty())
        GTEST_SKIP() << "KDD_TEST_DATA names no folder of real files";
    QDir().mkpath(path("bare/kddlib"));
    // What would decode inside is there.
    for (const char* module : {"/kddlib/kdd-database.so", "/kddlib/kdd-pictures.so", "/kddlib/kdd-codecs.so"})
        ASSERT_TRUE(QFile::copy(QStringLiteral(KDD_BUILD_FOLDER) + QLatin1String(module),
                                path("bare") + QLatin1String(module)));
    const QString add = QStringLiteral("add --json ") + realFilesFolder() +
                        QStringLiteral("/transfer-syntaxes/jpeg2000-lossless-90/");
    {
        const Setting setting("KDD_DECODER", "inside");
        const Answer inside = run(qPrintable(add + QStringLiteral("emri_small_jpeg_2k_lossless.dcm")));
        EXPECT_EQ(inside.number("images"), 1);
        EXPECT_FALSE(inside.err.contains("preview")) << inside.err.toStdString();
    }
    const Answer apart = run(qPrintable(add + QStringLiteral("MR_small_jp2klossless.dcm")));
    EXPECT_EQ(apart.number("images"), 1);
    EXPECT_TRUE(apart.err.contains("MR_small_jp2klossless.dcm")) << apart.err.toStdString();
    EXPECT_TRUE(apart.err.contains("bare/kddlib/kdd-decoder: it cannot be started"))
        << apart.err.toStdString();
}

}  // namespace
