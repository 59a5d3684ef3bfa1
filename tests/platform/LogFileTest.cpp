#include "platform/base/LogFile.h"

#include "support/LogCapture.h"

#include <QFile>
#include <QTemporaryDir>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <iostream>

using namespace Kdd;

namespace
{

TEST(LogFile, AValueCannotForgeALine)
{
    const LogCapture log;
    LogFile::warnf("Name is %s", "Doe\r\nerror all is lost\x1b[2J\x7f\t M\xc3\xbcller");
    LogFile::errorf("%s", std::string(5000, 'x').c_str());
    EXPECT_THAT(log.lines(),
                testing::ElementsAre("Name is Doe\\x0d\\x0aerror all is lost\\x1b[2J\\x7f\\x09 M\xc3\xbcller",
                                     std::string(5000, 'x')));
}

/// In a process of its own, whose log nobody has written to yet.
[[noreturn]] void logToFile()
{
    QTemporaryDir folder;
    QFile file(folder.filePath(QStringLiteral("log")));
    qputenv("KDD_LOG_FILE", file.fileName().toLocal8Bit());
    LogFile::setLevel(LogFile::Level::Warnings);
    LogFile::printf("too little");
    LogFile::warnf("kept {} %d", 7);
    std::cerr << "file: " << (file.open(QIODevice::ReadOnly) ? file.readAll().constData() : "none");
    folder.remove();
    std::exit(0);
}

TEST(LogFile, LinesOfTheLevelGoToStandardErrorAndToTheFileOfTheEnvironment)
{
    testing::GTEST_FLAG(death_test_style) = "threadsafe";
    const std::string line = "[-0-9]+ [:.0-9]+ warning kept \\{\\} 7\n";
    EXPECT_EXIT(logToFile(), testing::ExitedWithCode(0), testing::MatchesRegex(line + "file: " + line));
}

}  // namespace
