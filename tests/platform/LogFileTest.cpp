#include "platform/base/LogFile.h"

#include "support/FileContent.h"

#include <iostream>

using namespace Kdd;

namespace
{

/// In a process of its own, whose log nobody has written to yet.
[[noreturn]] void logToFile()
{
    QTemporaryDir folder;
    const QString path = folder.filePath(QStringLiteral("log"));
    qputenv("KDD_LOG_FILE", path.toLocal8Bit());
    LogFile::setLevel(LogFile::Level::Warnings);
    LogFile::printf("too little");
    LogFile::warnf("{} %s", "Doe\r\nerror\x1b[2J \xc3\xbc");
    LogFile::warnf("ours\n%s|\n", "Doe\n|");
    LogFile::write(LogFile::Severity::Warning, "ours\n" + LogFile::escaped("Doe\n"));
    std::cerr << "file: " << fileContent(path).constData();
    folder.remove();
    std::exit(0);
}

TEST(LogFile, LinesOfTheLevelGoToStandardErrorAndToTheFileAndNoValueCanForgeOne)
{
    testing::GTEST_FLAG(death_test_style) = "threadsafe";
    const std::string line = "[-0-9]+ [:.0-9]+ warning \\{\\} Doe\\\\x0d\\\\x0aerror\\\\x1b\\[2J \xc3\xbc\n"
                             "[^\n]*ours\nDoe\\\\x0a\\|\\|\n\n[^\n]*ours\nDoe\\\\x0a\n";
    EXPECT_EXIT(logToFile(), testing::ExitedWithCode(0), testing::MatchesRegex(line + "file: " + line));
}

}  // namespace
