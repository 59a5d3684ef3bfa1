#include "CatalogueFixture.h"
#include "kddlib/capi/kddtagfile.h"
#include "kddlib/tagfile/TagFileRemoval.h"
#include "platform/base/LogFile.h"
#include "platform/os/ExclusiveFile.h"
#include "support/LogCapture.h"

#include <syslog.h>

#include <cstdarg>
#include <iostream>
#include <vector>

namespace
{

void show(int priority, const char* format, va_list arguments)
{
    char line[200];
    std::vsnprintf(line, sizeof line, format, arguments);
    std::cerr << '<' << priority << '>' << line << '\n';
}

}  // namespace

/// The system's log of this program, where it can be seen.
extern "C" void syslog(int priority, const char* format, ...)
{
    va_list arguments;
    va_start(arguments, format);
    show(priority, format, arguments);
    va_end(arguments);
}

/// The same as it is called where the C library checks calls.
extern "C" void __syslog_chk(int priority, int /*flag*/, const char* format,
                             ...)  // NOLINT(bugprone-reserved-identifier)
{
    va_list arguments;
    va_start(arguments, format);
    show(priority, format, arguments);
    va_end(arguments);
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

    /// Whether the study could be synced; if so the bytes are those of a tag file, else there are none.
    static bool isSynced(const char* study, const char* user = nullptr)
    {
        unsigned int size = 1;
        const char* data = "";
        void* const handle = ReadAndSyncTagFileData(study, user, &size, &data);
        EXPECT_EQ(QByteArray(data, static_cast<int>(size)).startsWith("TaCa"), handle != nullptr);
        EXPECT_EQ(size == 0 && data == nullptr, handle == nullptr);
        FreeTagFileData(handle);
        return handle != nullptr;
    }

    const char* uids[3] = {"1", "unknown", "3"};
};

TEST_F(TagFileInterface, ImagesAndSeriesAreRemovedAndWithTheLastTheFile)
{
    EXPECT_TRUE(DeleteImagesInTagFile("1.2", 0, nullptr));
    EXPECT_TRUE(DeleteImagesInTagFile("1.2", 3, uids));
    EXPECT_EQ(imagesIn("1.2"), Uids{"2"});
    const char* series[] = {"1.2.1"};
    EXPECT_TRUE(DeleteSeriesInTagFile("1.2", 1, series));
    EXPECT_FALSE(QFile::exists(path()));
}

TEST_F(TagFileInterface, WhatIsNotThereNeedsNoDeletionAndNoLine)
{
    const LogCapture log;
    EXPECT_TRUE(DeleteTagFile("1.2"));
    EXPECT_FALSE(QFile::exists(path()));
    EXPECT_TRUE(DeleteTagFile("1.2"));
    EXPECT_TRUE(DeleteImagesInTagFile("1.2", 1, uids));
    EXPECT_TRUE(DeleteSeriesInTagFile("1.2", 1, uids));
    EXPECT_EQ(log.lines(), std::vector<std::string>());
}

TEST_F(TagFileInterface, AFileThatOthersHoldStaysAndALineSaysSo)
{
    QFile held;
    ASSERT_TRUE(openLockedFile(held, path(), FileLock::Exclusive, IfAbsent::Fail, {1, 0}));
    const LogCapture log;
    EXPECT_FALSE(DeleteImagesInTagFile("1.2", 1, uids));
    EXPECT_EQ(log.count("Could not remove images from the tag file of study 1.2: "), 1);
    EXPECT_FALSE(DeleteTagFile("1.2"));
    EXPECT_EQ(log.count("Tag file " + path().toStdString() + " could not be deleted (errno 11)"), 1);
    held.close();
    EXPECT_EQ(imagesIn("1.2").size(), 3);
}

TEST(TagFileRemoval, IsTriedSixTimes)
{
    for (const int failures : {0, 1, 5, 6}) {
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
    const LogCapture log;
    EXPECT_TRUE(isSynced("1.2", "user"));
    EXPECT_FALSE(isSynced("1.3") || isSynced("5.5"));
    EXPECT_EQ(log.count("Loaded and synced tag file for study 1.2 ("), 1);
    EXPECT_EQ(imagesIn("1.2").size(), 3) << "the file stays as it is";
}

TEST_F(TagFileInterface, NullsAndNegativeCountsAreRefusedWithALineEach)
{
    uids[1] = nullptr;
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
    EXPECT_FALSE(isSynced(nullptr));
    EXPECT_EQ(ReadAndSyncTagFileData("1.2", nullptr, nullptr, &data), nullptr);
    EXPECT_EQ(ReadAndSyncTagFileData("1.2", nullptr, &size, nullptr), nullptr);
    EXPECT_EQ(log.count(" must not be "), 12);
    EXPECT_EQ(log.lines().size(), 12U);
    EXPECT_EQ(imagesIn("1.2").size(), 3);
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
    const std::string toSystem = "<15>\\[TagMerge\\] done\n<15>\\[TagMerge\\] here\n";
    const auto toError = [](const char* timings) {
        return std::string("[^<]*Configure logging: debug=1 timings=") + timings +
               "\n[^<]*Could not open /absent: [^<]*\\[TagMerge\\] done\nhere\n";
    };
    const std::pair<short, std::string> cases[] = {
        {0, toSystem}, {1, toError("0")}, {2, toSystem}, {3, toError("1")}};
    for (const auto& [flags, written] : cases)
        EXPECT_EXIT(configureAndLog(flags), testing::ExitedWithCode(0), testing::MatchesRegex(written));
}

}  // namespace
}  // namespace Kdd
