#include "CommandLineFixture.h"

using namespace Kdd;

namespace
{

/// What programs read: one whole JSON value on standard output, or nothing where a command failed before it had one.
class Json : public CommandLine
{
protected:
    Answer run(const QByteArray& command) const { return kdd("--json " + command); }
};

TEST_F(Json, IsWholeOrAbsentWhateverTheCommandComesTo)
{
    // With the exit code, and whether there is a result all the same.
    const std::tuple<const char*, int, bool> kRows[] = {
        {"list", 0, true},
        {"list --date x", 2, false},
        {"index @1", 0, true},
        {"index @1 none", 1, true},
        {"add @1", 0, true},
        {"add none", 1, true},
        {"build --all", 0, true},
        {"stack", 0, true},
        {"stack 9", 1, true},
        {"show 1.2", 0, true},
        {"show 1.2 --tree", 0, true},
        {"show 9 --tree", 1, false},
        {"metadata 1.2", 0, true},
        {"metadata 1.2 --image 9", 1, false},
        {"stat 1.2", 0, true},
        {"previews --all @out", 0, true},
        {"sync 1.2", 0, true},
        {"verify --all", 0, true},
        {"verify 9", 1, true},
        {"diff 1.2 1.2", 0, true},
        {"sample @out --images 1", 0, true},
        {"sample /proc/kdd", 1, false},
        {"get http://127.0.0.1:1/x -o @out", 1, false},
        {"put none gs://b/o", 1, false},
        {"qa @job.xml --study 1.2 --image 1", 0, true},
        {"qa @job.xml --study 1.2 --image 9", 1, true},
        {"qa none --study 1.2 --image 1", 1, false},
        {"delete 1.2 --image 9", 1, false},
        {"delete 1.2 --image 1", 0, true},
        {"--database sqlite:/proc/none/kdd list", 1, false},
    };
    addTwoStudies();
    put("job.xml", jobXml(DCM_PatientName, "Roe^R"));
    for (const auto& [command, exitCode, hasResult] : kRows) {
        const Answer answer = run(command);
        SCOPED_TRACE((command + QByteArray("\n") + answer.out + answer.err).toStdString());
        QJsonParseError fault;
        QJsonDocument::fromJson(answer.out, &fault);
        EXPECT_EQ(answer.exitCode, exitCode);
        EXPECT_EQ(answer.out.isEmpty(), !hasResult);
        EXPECT_TRUE(!hasResult || fault.error == QJsonParseError::NoError);
        EXPECT_EQ(answer.err.isEmpty(), exitCode == 0);
    }
}

TEST_F(Json, ShowsANodeItsOwnEntriesAndTheTree)
{
    addTwoStudies();
    const auto shown = [this](const char* command, const char* place) {
        return jsonAt(run(command).out, place);
    };
    EXPECT_EQ(shown("show 1.2 --image 1", ""), shown("metadata 1.2 --image 1", "0"));
    EXPECT_TRUE(shown("show 1.2 --image 1", "00100010").isObject());
    EXPECT_TRUE(shown("show 1.2 --image 1 --own", "00080018").isObject());
    EXPECT_TRUE(shown("show 1.2 --image 1 --own", "00100010").isUndefined()) << "the study has it";
    EXPECT_TRUE(shown("show 1.2 --own", "00100010").isObject());
    const QJsonValue study = shown("show 1.2 --tree", "");
    EXPECT_EQ(textAt(study, "study"), "1.2");
    EXPECT_EQ(textAt(study, "children/1/series"), "1.2.4");
    EXPECT_EQ(textAt(study, "children/1/children/1/image"), "3");
}

}  // namespace
