#include "CatalogueFixture.h"
#include "kddlib/capi/kddtagfile.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagfile/TagFileRemoval.h"
#include "platform/base/LogFile.h"
#include "platform/os/ExclusiveFile.h"
#include "support/LogCapture.h"
#include "support/TreeText.h"

#include <QFile>

#include <gtest/gtest.h>
#include <syslog.h>

#include <cstdarg>
#include <iostream>

/// The system's log of this program, where it can be seen.
extern "C" void syslog(int priority, const char* format, ...)
{
    char line[200];
    va_list arguments;
    va_start(arguments, format);
    std::vsnprintf(line, sizeof line, format, arguments);
    va_end(arguments);
    std::cerr << '<' << priority << '>' << line << '\n';
}

namespace Kdd
{
namespace
{

class TagFileInterface : public CatalogueFixture
{
protected:
    TagFileInterface() { writeStudy("1.2", {"1", "2", "3"}); }

    static QString path() { return TagFile::cacheFilePathForStudy("1.2"); }
};

TEST_F(TagFileInterface, ImagesAndSeriesAreRemovedAndWithTheLastTheFile)
{
    const char* uids[] = {"1", "unknown", "3"};
    EXPECT_TRUE(DeleteImagesInTagFile("1.2", 0, nullptr));
    EXPECT_EQ(imagesInFile("1.2"), (QList<QByteArray>{"1", "2", "3"}));
    EXPECT_TRUE(DeleteImagesInTagFile("1.2", 3, uids));
    EXPECT_EQ(imagesInFile("1.2"), QList<QByteArray>{"2"});
    const char* series[] = {"1.2.3"};
    EXPECT_TRUE(DeleteSeriesInTagFile("1.2", 1, series));
    EXPECT_FALSE(QFile::exists(path()));
    writeStudy("1.2", {"1"});
    EXPECT_TRUE(DeleteImagesInTagFile("1.2", 1, uids));
    EXPECT_FALSE(QFile::exists(path()));
}

TEST_F(TagFileInterface, WhatIsNotThereNeedsNoDeletionAndNoLine)
{
    const char* uids[] = {"1"};
    ASSERT_TRUE(DeleteTagFile("1.2"));
    EXPECT_FALSE(QFile::exists(path()));
    const LogCapture log;
    EXPECT_TRUE(DeleteTagFile("1.2"));
    EXPECT_TRUE(DeleteImagesInTagFile("1.2", 1, uids));
    EXPECT_TRUE(DeleteSeriesInTagFile("1.2", 1, uids));
    EXPECT_EQ(log.lines(), std::vector<std::string>());
}

TEST_F(TagFileInterface, AFileThatOthersHoldStaysAndALineSaysSo)
{
    QFile held;
    ASSERT_TRUE(openLockedFile(held, path(), FileLock::Exclusive, IfAbsent::Fail, {1, 0}));
    const char* uids[] = {"1"};
    const LogCapture log;
    EXPECT_FALSE(DeleteImagesInTagFile("1.2", 1, uids));
    EXPECT_EQ(log.count("Could not remove images from the tag file of study 1.2: "), 1);
    EXPECT_FALSE(DeleteTagFile("1.2"));
    EXPECT_EQ(log.count("Tag file " + path().toStdString() + " could not be deleted (errno 11)"), 1);
    held.close();
    EXPECT_EQ(imagesInFile("1.2").size(), 3);
}

TEST(TagFileRemoval, IsTriedSixTimes)
{
    for (int failures = 0; failures <= 6; ++failures) {
        const LogCapture log;
        int attempts = 0;
        const bool isGone = removeTagFile(QStringLiteral("f"), [&](const QString&) {
            return SystemResult::of(++attempts > failures ? 0 : 21);
        });
        EXPECT_EQ(isGone, failures < 6);
        EXPECT_EQ(attempts, std::min(failures + 1, 6));
        const std::string line = isGone
                                     ? "successfully deleted after " + std::to_string(failures) + " retries"
                                     : "could not be deleted (errno 21)";
        EXPECT_EQ(log.lines(), std::vector<std::string>(failures > 0 ? 1 : 0, "Tag file f " + line));
    }
}

TEST_F(TagFileInterface, AStudyOfBothTheDatabaseAndATagFileIsSynced)
{
    writeStudy("1.3", {"1"});
    registerImages("1.2", {"1", "3"});
    registerImages("5.5", {"1"});
    for (const std::string study : {"1.2", "1.3", "5.5"}) {
        const bool isSynced = study == "1.2";
        unsigned int size = 1;
        const char* data = "";
        const LogCapture log;
        void* const handle = ReadAndSyncTagFileData(study.c_str(), isSynced ? "user" : nullptr, &size, &data);
        EXPECT_EQ(handle != nullptr, isSynced);
        EXPECT_EQ(QByteArray(data, static_cast<int>(size)).startsWith("TaCa"), isSynced);
        EXPECT_EQ(size == 0 && data == nullptr, !isSynced);
        EXPECT_EQ(log.count("Loaded and synced tag file for study 1.2 (" + std::to_string(size) + " bytes)"),
                  isSynced);
        FreeTagFileData(handle);
    }
    EXPECT_EQ(imagesInFile("1.2").size(), 3) << "the file stays as it is";
}

TEST_F(TagFileInterface, NullsAndNegativeCountsAreRefusedWithALineEach)
{
    const char* uids[] = {"1", nullptr};
    unsigned int size = 1;
    const char* data = "";
    const LogCapture log;
    EXPECT_FALSE(DeleteTagFile(nullptr));
    for (const auto remove : {DeleteImagesInTagFile, DeleteSeriesInTagFile}) {
        EXPECT_FALSE(remove(nullptr, 1, uids));
        EXPECT_FALSE(remove("1.2", -1, uids));
        EXPECT_FALSE(remove("1.2", 1, nullptr));
        EXPECT_FALSE(remove("1.2", 2, uids));
    }
    EXPECT_EQ(ReadAndSyncTagFileData(nullptr, nullptr, &size, &data), nullptr);
    EXPECT_TRUE(size == 0 && data == nullptr);
    EXPECT_EQ(ReadAndSyncTagFileData("1.2", nullptr, nullptr, &data), nullptr);
    EXPECT_EQ(ReadAndSyncTagFileData("1.2", nullptr, &size, nullptr), nullptr);
    EXPECT_EQ(log.count(" must not be "), 12);
    EXPECT_EQ(log.lines().size(), 12U);
    EXPECT_EQ(imagesInFile("1.2").size(), 3);
}

/// In a process of its own, for the log is the process's.
[[noreturn]] void configureAndLog(short flags)
{
    TagFile::setDebugOptions(6);
    ConfigureLogging(flags, "sqlite:/nowhere");
    TagFile().readCacheFile(QStringLiteral("/absent"), "1.2", false);
    LogFile::tracef(0, "TagMerge", "done\nhere");
    const bool isReplaced = TagFile::debugOption(1) == (flags >= 2) && !TagFile::debugOption(6);
    std::exit(isReplaced && Kxg::DatabaseServer() == "sqlite:/nowhere" ? 0 : 1);
}

TEST(LoggingInterface, DebugGoesToStandardErrorAndAllElseToTheSystemsLog)
{
    testing::GTEST_FLAG(death_test_style) = "threadsafe";
    const std::pair<short, const char*> cases[] = {
        {0, "<15>\\[TagMerge\\] done\n<15>\\[TagMerge\\] here\n"},
        {1, "[^<]*Configure logging: debug=1 timings=0\n[^<]*Could not open /absent: [^<]*\\[TagMerge\\] "
            "done\nhere\n"},
        {2, "<15>\\[TagMerge\\] done\n<15>\\[TagMerge\\] here\n"},
        {3, "[^<]*Configure logging: debug=1 timings=1\n[^<]*Could not open /absent: [^<]*\\[TagMerge\\] "
            "done\nhere\n"},
    };
    for (const auto& [flags, written] : cases)
        EXPECT_EXIT(configureAndLog(flags), testing::ExitedWithCode(0), testing::MatchesRegex(written));
}

}  // namespace
}  // namespace Kdd
