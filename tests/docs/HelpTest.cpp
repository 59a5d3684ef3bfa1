#include "SampleArchive.h"

#include <QRegularExpression>
#include <QStandardPaths>

using namespace Kdd;

namespace
{

class Help : public SampleArchive
{
protected:
    /// The names that `kdd --help` lists.
    QStringList commands() const
    {
        QStringList names;
        const QString page = QString::fromUtf8(kdd("--help").out).section(QStringLiteral("\n\n\n"), 1);
        for (auto it = kCommand.globalMatch(page); it.hasNext();)
            names.append(it.next().captured(1));
        return names;
    }

    static QStringList examplesIn(const QString& help)
    {
        QStringList examples;
        for (const QString& line :
             help.section(QStringLiteral("\nExamples:\n"), 1).split(QLatin1Char('\n'))) {
            if (line.startsWith(QLatin1String("  kdd ")))
                examples.append(line.trimmed());
        }
        return examples;
    }

    const QRegularExpression kOption{QStringLiteral("^  (-[-,a-z]+)"), QRegularExpression::MultilineOption};
    const QRegularExpression kCommand{QStringLiteral("^  ([a-z]+) {4,}\\S"),
                                      QRegularExpression::MultilineOption};
};

TEST_F(Help, ListsEveryCommandUnderAHeading)
{
    EXPECT_GE(commands().size(), 17);
    const QByteArray page = kdd("--help").out;
    for (const char* heading : {"\nTake images in:\n  add ", "\nLook at what is stored:\n  list ",
                                "\nChange what is stored:\n  sync ", "\nCheck and compare:\n  verify "})
        EXPECT_TRUE(page.contains(heading)) << heading;
    EXPECT_FALSE(page.contains("describe-for")) << "that is for the build";
}

TEST_F(Help, ShowsExamplesThatWork)
{
    fill();
    ASSERT_TRUE(QDir(mFolder.path()).rename(QStringLiteral("store"), QStringLiteral("filled")));
    for (const QString& command : commands()) {
        const QString help =
            QString::fromUtf8(kdd((command + QStringLiteral(" --help")).toLatin1().constData()).out);
        const QStringList examples = examplesIn(help);
        ASSERT_FALSE(examples.isEmpty()) << command.toStdString();
        EXPECT_TRUE(examples.first().contains(QLatin1Char(' ') + command));
        EXPECT_TRUE(help.contains(QStringLiteral("Usage: kdd ") + command)) << help.toStdString();
        for (const QString& example : examples) {
            const Answer answer = shell({QStringLiteral("rm -rf store && cp -a filled store"), example});
            EXPECT_EQ(answer.exitCode, 0) << example.toStdString() << '\n' << answer.err.toStdString();
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
    const QByteArray& page = printed.out;
    for (const QString& command : commands()) {
        const QString help =
            QString::fromUtf8(kdd((command + QStringLiteral(" --help")).toLatin1().constData()).out);
        EXPECT_TRUE(page.contains("\n   kdd " + command.toUtf8() + '\n')) << command.toStdString();
        for (const QString& example : examplesIn(help))
            EXPECT_TRUE(page.contains(example.toUtf8())) << example.toStdString();
        for (auto it = kOption.globalMatch(help); it.hasNext();) {
            const QString option = it.next().captured(1);
            EXPECT_TRUE(page.contains(option.toUtf8())) << option.toStdString();
        }
    }
}

}  // namespace
