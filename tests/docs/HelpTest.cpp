#include "Pages.h"
#include "SampleArchive.h"

#include <QStandardPaths>

using namespace Kdd;

namespace
{

class Help : public SampleArchive
{
protected:
    std::set<std::string> commands() const
    {
        const QString page = QString::fromUtf8(kdd("--help").out).section(QStringLiteral("\n\n\n"), 1);
        return matches(page, "^  ([a-z]+) {4,}\\S");
    }
};

TEST_F(Help, ShowsExamplesThatWork)
{
    EXPECT_GE(commands().size(), 17);
    fill();
    // With the files that it was filled from, for an example may write them anew.
    for (const QString& name : {QStringLiteral("store"), QStringLiteral("day")})
        ASSERT_TRUE(QDir(mFolder.path()).rename(name, name + QStringLiteral(".filled")));
    for (const std::string& command : commands()) {
        const QString help = QString::fromUtf8(kdd((command + " --help").c_str()).out);
        EXPECT_TRUE(help.contains(QLatin1String("Usage: kdd ") + QString::fromStdString(command)));
        const auto examples = matches(help.section(QStringLiteral("\nExamples:\n"), 1), "^  (kdd .*)$");
        EXPECT_FALSE(examples.empty()) << command;
        for (const std::string& example : examples) {
            const Answer answer =
                shell({QStringLiteral("rm -rf store day && cp -a store.filled store && cp -a day.filled day"),
                       QString::fromStdString(example)});
            EXPECT_EQ(answer.exitCode, 0) << example << '\n' << answer.err.toStdString();
        }
    }
}

TEST_F(Help, IsWhatTheManualSays)
{
    const QString manual = QStringLiteral(KDD_DESCRIPTIONS "/kdd.1");
    if (QStandardPaths::findExecutable(QStringLiteral("groff")).isEmpty())
        GTEST_SKIP() << "there is no groff";
    // As plain text, in lines so long that none is broken.
    const Answer printed =
        run(QStringLiteral("groff"),
            QStringLiteral("-ww -man -Tascii -P-cbou -rLL=900n ").append(manual).split(QLatin1Char(' ')));
    EXPECT_EQ(printed.exitCode, 0);
    EXPECT_EQ(printed.err, "") << "warnings";
    for (const std::string& command : commands())
        EXPECT_TRUE(printed.out.contains(("\n   kdd " + command + '\n').c_str())) << command;
}

}  // namespace
