#include "CommandLineFixture.h"

#include <set>

using namespace Kdd;

namespace
{

/// Commands that meet at the same time. Whatever happened, one build heals the archive.
class Operations : public CommandLine
{
protected:
    /// Images 7.N.1 to 7.N.8 of studies 1.1 to 1.3, of which those with a number below `count` are there so far.
    void saveImages(int count)
    {
        for (int study = 1; study <= 3; ++study) {
            for (int i = 1; i <= count; ++i) {
                const QByteArray uid = "7." + QByteArray::number(study) + '.' + QByteArray::number(i);
                const QByteArray studyUID = "1." + QByteArray::number(study);
                if (!QFile::exists(file(uid.constData())))
                    save(uid, aSlice(uid, i, i)
                                  .inStudy(studyUID)
                                  .inSeries(studyUID + ".1")
                                  .with("PatientName=Doe^J|FrameOfReferenceUID=" + studyUID));
                mExpected.insert(uid);
            }
        }
    }

    std::unique_ptr<QProcess> begin(const QByteArray& command) const
    {
        return start(command == "add" ? "add @" : command);
    }

    /// A build, a check, and a look at what is there.
    void expectHealed(const std::string& after)
    {
        const Answer built = kdd("build --all");
        EXPECT_EQ(built.exitCode, 0) << after << built.err.toStdString();
        const Answer verified = kdd("verify --all --json");
        EXPECT_EQ(verified.exitCode, 0) << after << verified.err.toStdString();
        std::set<QByteArray> found;
        for (const char* study : {"1.1", "1.2", "1.3"}) {
            const QByteArray metadata = kdd("metadata " + QByteArray(study)).out;
            for (const QByteArray& image : allImages()) {
                if (metadata.contains('"' + image + '"'))
                    found.insert(image);
            }
        }
        EXPECT_EQ(found, mExpected) << after;
    }

    /// Done, or a deletion of what is not there any more: it came to its end before, or another one did it.
    static bool isDone(const QByteArray& command, const Answer& answer)
    {
        return answer.exitCode == 0 ||
               (command.startsWith("delete") &&
                (answer.err.contains("has no image") || answer.err.contains("No study is named")));
    }

    QList<QByteArray> allImages() const
    {
        QList<QByteArray> all;
        for (const QString& name : QDir(images()).entryList(QDir::Files))
            all.append(name.toUtf8());
        return all;
    }

    std::set<QByteArray> mExpected;
};

struct Pair
{
    const char* name;
    const char* first;
    const char* second;
    const char* removed;  // what is to be gone in the end
};

class PairOfOperations : public Operations, public testing::WithParamInterface<Pair>
{
};

TEST_P(PairOfOperations, AtTheSameTimeLoseNothing)
{
    saveImages(4);
    EXPECT_EQ(finish(*begin("add")).exitCode, 0);
    saveImages(5);
    if (qstrcmp(GetParam().first, "add") != 0) {
        EXPECT_EQ(finish(*begin("add")).exitCode, 0);
    }
    const QByteArray edit = job(DCM_PatientName, "Roe^R");
    const QByteArray commands[] = {QByteArray(GetParam().first).replace("JOB", edit),
                                   QByteArray(GetParam().second).replace("JOB", edit)};
    const std::unique_ptr<QProcess> processes[] = {begin(commands[0]), begin(commands[1])};
    for (int i = 0; i < 2; ++i) {
        const Answer answer = finish(*processes[i]);
        EXPECT_TRUE(isDone(commands[i], answer)) << answer.err.toStdString();
    }
    for (const QByteArray& image : allImages()) {
        if (GetParam().removed != nullptr && image.startsWith(GetParam().removed))
            mExpected.erase(image);
    }
    expectHealed(GetParam().name);
    if (QByteArray(GetParam().second).startsWith("qa")) {
        EXPECT_TRUE(kdd("metadata 1.1 --image 7.1.2").out.contains("Roe^R"));
    }
}

constexpr const char* kEdit = "qa JOB --study 1.1 --image 7.1.2";

const Pair kPairs[] = {
    {"AddAndAdd", "add", "add", nullptr},
    {"AddAndBuild", "add", "build --all --again", nullptr},
    {"AddAndSync", "add", "sync 1.1", nullptr},
    {"AddAndStack", "add", "stack", nullptr},
    {"AddAndEdit", "add", kEdit, nullptr},
    {"BuildAndBuild", "build --all --again", "build --all --again", nullptr},
    {"BuildAndDeleteStudy", "build --all --again", "delete 1.1", "7.1."},
    {"BuildAndDeleteImage", "build --all --again", "delete 1.2 --image 7.2.3", "7.2.3"},
    {"BuildAndEdit", "build --all --again", kEdit, nullptr},
    {"StackAndDeleteImage", "stack", "delete 1.2 --image 7.2.3", "7.2.3"},
    {"StackAndBuild", "stack", "build --all --again", nullptr},
    {"StackAndEdit", "stack", kEdit, nullptr},
    {"DeleteAndDelete", "delete 1.2 --image 7.2.3", "delete 1.2 --image 7.2.3", "7.2.3"},
    {"DeleteAndEdit", "delete 1.1 --image 7.1.3", kEdit, "7.1.3"},
};

INSTANTIATE_TEST_SUITE_P(Meeting, PairOfOperations, testing::ValuesIn(kPairs),
                         [](const auto& pair) { return std::string(pair.param.name); });

}  // namespace
