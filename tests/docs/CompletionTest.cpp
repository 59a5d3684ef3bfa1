#include "system/CommandLineFixture.h"

#include <QFileInfo>

using namespace Kdd;

namespace
{

/// A command line up to the cursor, as readline hands it over: split at blanks, ":" and "=". "|" stands before the word that
/// is completed.
struct Case
{
    const char* line;
    const char* expected;
};

const Case kCases[] = {
    {"kdd |st", "stack stat"},
    {"kdd --store STORE |ver", "verify"},
    {"kdd |--comp", "--compression"},
    {"kdd --compression |", "lzma none zlib"},
    {"kdd list |--wa", "--waiting"},
    {"kdd add |--wa", ""},
    {"kdd show --store STORE |1.2.1", "1.2.10 1.2.11"},
    {"kdd --store = STORE show |1.3", "1.3.6"},
    {"kdd --database sqlite : STORE/kdd.sqlite show |1.3", "1.3.6"},
    {"kdd --store STORE qa job.xml --study |1.3", "1.3.6"},
    {"kdd --store STORE diff 1.2.10 |1.3", "1.3.6"},
    {"kdd frobnicate |", ""},
    {"kdd add |ja", "jan jan.xml"},
    {"kdd qa |ja", "jan jan.xml"},
    {"kdd put jan.xml |ja", ""},
};

TEST_F(CommandLine, IsCompletedByBash)
{
    for (const char* uid : {"1.2.10", "1.2.11", "1.3.6"})
        save(uid, anImage("1").inStudy(uid));
    ASSERT_EQ(addImages().exitCode, 0);
    ASSERT_TRUE(QDir(mFolder.path()).mkdir(QStringLiteral("jan")));
    put("../jan.xml", "");
    QString script = QStringLiteral("PATH=%1:$PATH; cd %2 && source %3\n")
                         .arg(QFileInfo(QStringLiteral(KDD_BINARY)).path(), mFolder.path(),
                              QStringLiteral(KDD_DESCRIPTIONS "/kdd.bash"));
    for (const Case& one : kCases) {
        QString words = QLatin1String(one.line);
        words.replace(QLatin1String("STORE"), path("store"))
            .replace(QLatin1String("|"), QLatin1String("\"\""));
        script += QStringLiteral("COMP_WORDS=(%1); COMP_CWORD=$((${#COMP_WORDS[@]} - 1)); _kdd; echo "
                                 "$(printf '%s\\n' \"${COMPREPLY[@]}\" | sort)\n")
                      .arg(words);
    }
    QProcess bash;
    bash.start(QStringLiteral("bash"), {QStringLiteral("--norc"), QStringLiteral("-c"), script});
    const Answer answer = finish(bash);
    EXPECT_EQ(answer.err, "");
    const QList<QByteArray> replies = answer.out.split('\n');
    ASSERT_EQ(std::size_t(replies.size()), std::size(kCases) + 1);
    for (std::size_t i = 0; i < std::size(kCases); ++i)
        EXPECT_EQ(replies.at(int(i)), kCases[i].expected) << kCases[i].line;
}

}  // namespace
