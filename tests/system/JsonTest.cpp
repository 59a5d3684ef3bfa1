#include "CommandLineFixture.h"

using namespace Kdd;

namespace
{

/// What programs read: one whole JSON value on standard output, or nothing where a command failed before it had one.
class Json : public CommandLine
{
protected:
    struct Row
    {
        const char* command;
        int exitCode;
        bool hasResult = true;
    };

    Answer run(const char* command) const { return kdd(("--json " + QByteArray(command)).constData()); }

    void expectWhole(const Row& row) const
    {
        const Answer answer = run(row.command);
        QJsonParseError fault;
        QJsonDocument::fromJson(answer.out, &fault);
        EXPECT_EQ(answer.exitCode, row.exitCode) << row.command << '\n' << answer.err.toStdString();
        EXPECT_EQ(answer.out.isEmpty(), !row.hasResult) << row.command << '\n' << answer.out.toStdString();
        EXPECT_TRUE(!row.hasResult || fault.error == QJsonParseError::NoError) << answer.out.toStdString();
        EXPECT_EQ(answer.err.isEmpty(), row.exitCode == 0) << row.command << '\n' << answer.err.toStdString();
    }
};

TEST_F(Json, IsWholeOrAbsentWhateverTheCommandComesTo)
{
    const Row kRows[] = {
        {"list", 0},
        {"list --date x", 2, false},
        {"index @1", 0},
        {"index @1 none", 1},
        {"add @1", 0},
        {"add none", 1},
        {"build --all", 0},
        {"stack", 0},
        {"stack 9", 1},
        {"show 1.2", 0},
        {"show 1.2 --tree", 0},
        {"show 9 --tree", 1, false},
        {"metadata 1.2", 0},
        {"metadata 1.2 --image 9", 1, false},
        {"stat 1.2", 0},
        {"previews --all @out", 0},
        {"sync 1.2", 0},
        {"verify --all", 0},
        {"verify 9", 1},
        {"diff 1.2 1.2", 0},
        {"sample @out --images 1", 0},
        {"sample /proc/kdd", 1, false},
        {"get http://127.0.0.1:1/x -o @out", 1, false},
        {"put none gs://b/o", 1, false},
        {"qa @job.xml --study 1.2 --image 1", 0},
        {"qa @job.xml --study 1.2 --image 9", 1},
        {"qa none --study 1.2 --image 1", 1, false},
        {"delete 1.2 --image 9", 1, false},
        {"delete 1.2 --image 1", 0},
        {"--database sqlite:/proc/none/kdd list", 1, false},
    };
    addTwoStudies();
    put("job.xml", "<Job><Tag Group='0010' Element='0010'><Value>Roe^R</Value></Tag></Job>");
    for (const Row& row : kRows)
        expectWhole(row);
}

TEST_F(Json, ShowsANodeItsOwnEntriesAndTheTree)
{
    addTwoStudies();
    const auto shown = [this](const char* command) {
        return QJsonDocument::fromJson(run(command).out).object();
    };
    const QJsonObject image = shown("show 1.2 --image 1");
    EXPECT_EQ(image, QJsonDocument::fromJson(run("metadata 1.2 --image 1").out).array().at(0).toObject());
    EXPECT_TRUE(image.contains(QLatin1String("00100010")));
    const QJsonObject own = shown("show 1.2 --image 1 --own");
    EXPECT_TRUE(own.contains(QLatin1String("00080018")));
    EXPECT_FALSE(own.contains(QLatin1String("00100010"))) << "the study has it";
    EXPECT_TRUE(shown("show 1.2 --own").contains(QLatin1String("00100010")));
    const QJsonObject study = shown("show 1.2 --tree");
    EXPECT_EQ(study.value(QLatin1String("study")), QLatin1String("1.2"));
    const QJsonValue series = study.value(QLatin1String("children")).toArray().at(1);
    EXPECT_EQ(series[QLatin1String("series")], QLatin1String("1.2.4"));
    EXPECT_EQ(series[QLatin1String("children")][1][QLatin1String("image")], QLatin1String("3"));
}

}  // namespace
