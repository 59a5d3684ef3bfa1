#include "TagFileFixture.h"
#include "platform/base/LogFile.h"
#include "platform/database/TagFileStamp.h"
#include "support/Process.h"

#include <filesystem>
#include <functional>
#include <future>

using namespace Kdd;

namespace
{

const char* const kStudy = "1.2";

bool write(TagFile& file)
{
    return file.writeCacheFile();
}

bool merge(TagFile& file)
{
    return file.mergeIntoCacheFile();
}

class TagFileCache : public TagFileTest
{
protected:
    void TearDown() override { LogFile::setLevel(LogFile::Level::Information); }

    /// Adds images whose values cannot be compressed much, so that more images always take more room.
    static void fill(TagFile& file, int from, int to)
    {
        for (int i = from; i <= to; ++i) {
            DatasetBuilder image = anImage(QByteArray::number(i).constData());
            for (int word = 1; word < 20; ++word)
                image.withItem(
                    DCM_RequestAttributesSequence,
                    anItem().with(DCM_CodeValue, QByteArray::number(i * word * 1103515245LL).right(12)));
            add(file, image);
        }
    }

    static bool put(int from, int to, bool (*how)(TagFile&))
    {
        TagFile file;
        fill(file, from, to);
        return how(file);
    }
    using TagFileTest::put;

    /// How many images a reader finds; -1 when it finds no study.
    static int imagesFound()
    {
        TagFile file;
        return file.readCacheFileForStudy(kStudy, false) ? file.imagesByUID().size() : -1;
    }
};

TEST_F(TagFileCache, WhatIsWrittenIsFoundByTheDigestOfItsUid)
{
    TagFile file;
    fill(file, 1, 3);
    ASSERT_TRUE(file.writeCacheFile());
    TagFile again;
    ASSERT_TRUE(again.readCacheFileForStudy(kStudy, false));
    EXPECT_EQ(treeText(again), treeText(file));
    EXPECT_FALSE(again.close()) << "not kept open";
    const QString elsewhere = mStore.filePath("some/where/else.tc");
    ASSERT_TRUE(file.writeCacheFile(elsewhere.toLocal8Bit().constData()));
    EXPECT_EQ(content(elsewhere), content());
    EXPECT_FALSE(again.readCacheFile(elsewhere, "1.2.0", false)) << "another study";
    // Of the UID and a line feed.
    TagFile::setMetaFolder("/meta");
    EXPECT_EQ(TagFile::cacheFilePathForStudy("1.2.3"),
              QStringLiteral("/meta/e3/16/640a77b2a412ac0fe91cb85078c4.tc"));
    EXPECT_EQ(file.cacheFilePath(), path());
}

TEST_F(TagFileCache, AStampedReadKnowsTheStateThatWasWritten)
{
    const LogCapture log;
    TagFile file;
    EXPECT_FALSE(file.readStampedWhenFree(path(), kStudy));
    EXPECT_TRUE(file.stamp() == Kxg::TagFileStamp());
    ASSERT_TRUE(put(1, 9, write));
    const int longest = content().size();
    ASSERT_TRUE(file.readCacheFileForStudy(kStudy, true));
    const char* gone[] = {"1", "2", "3"};
    file.removeImages(3, gone);
    ASSERT_TRUE(file.writeCacheFile());
    EXPECT_EQ(content().size(), longest) << "bytes of the former content follow";
    TagFile again;
    ASSERT_TRUE(again.readStampedWhenFree(path(), kStudy));
    EXPECT_TRUE(again.stamp() == file.stamp());
    EXPECT_FALSE(again.stamp().digest.isEmpty());
    ASSERT_TRUE(put(10, 10, merge));
    ASSERT_TRUE(again.readStampedWhenFree(path(), kStudy));
    EXPECT_FALSE(again.stamp() == file.stamp());
}

TEST_F(TagFileCache, AnAbsentFileIsWorthALineOnlyToWhoeverDebugs)
{
    const LogCapture log;
    TagFile file;
    EXPECT_FALSE(file.readCacheFileForStudy(kStudy, false) || file.readCacheFileForStudy(kStudy, true));
    EXPECT_TRUE(log.lines().empty());
    EXPECT_FALSE(file.failure().isEmpty() || file.wasLockedOut());
    LogFile::setLevel(LogFile::Level::Timing);
    EXPECT_FALSE(file.readCacheFileForStudy(kStudy, false));
    EXPECT_EQ(log.count(named("Could not open ")), 1);
}

TEST_F(TagFileCache, SaysWhatCannotBeReadOrWritten)
{
    const LogCapture log;
    put(path(), "no tag file");
    TagFile file;
    EXPECT_FALSE(file.readCacheFileForStudy(kStudy, true));
    EXPECT_EQ(log.count("Tag file has incorrect header"), 1);
    EXPECT_EQ(log.count(named("Could not read ")), 1);
    EXPECT_FALSE(file.close());
    QFile::remove(path());
    QDir().mkpath(path());
    EXPECT_FALSE(file.readCacheFileForStudy(kStudy, false));
    EXPECT_EQ(log.count(named("Could not open ") + ": "), 1);
    fill(file, 1, 1);
    EXPECT_FALSE(file.writeCacheFile());
    EXPECT_EQ(log.count(named("Could not open ") + " for writing"), 1);
    EXPECT_FALSE(file.writeCacheFile("/proc/kdd/file.tc"));
    EXPECT_EQ(log.count("Could not open /proc/kdd/file.tc for writing"), 1);
    EXPECT_FALSE(file.failure().isEmpty());
    EXPECT_EQ(file.imagesByUID().size(), 1);
}

TEST_F(TagFileCache, WhoKeepsItOpenLocksOthersOut)
{
    ASSERT_TRUE(put(1, 2, write));
    TagFile file;
    ASSERT_TRUE(file.readCacheFileForStudy(kStudy, true));
    const auto isLockedOut = [](bool (*operation)(TagFile&), const char* ending) {
        const LogCapture log;
        TagFile other;
        fill(other, 3, 3);
        return !operation(other) && other.wasLockedOut() && !other.failure().isEmpty() &&
               log.count(named("Could not open ") + ending) == (*ending != 0 ? 1 : 0);
    };
    const auto isReader = [&] {
        return isLockedOut([](TagFile& other) { return other.readCacheFileForStudy(kStudy, false); }, ": ");
    };
    const auto isKeeper = [&] {
        return isLockedOut([](TagFile& other) { return other.readCacheFileForStudy(kStudy, true); }, "");
    };
    const auto isMerger = [&] {
        return isLockedOut([](TagFile& other) { return merge(other) || other.imagesByUID().size() != 1; },
                           " for read-write: error code ");
    };
    EXPECT_EQ(inChild(isReader), 1);
    EXPECT_EQ(inChild(isKeeper), 1);
    EXPECT_EQ(inChild(isMerger), 1);
    fill(file, 4, 4);
    EXPECT_TRUE(file.writeCacheFile());
    EXPECT_EQ(inChild([] { return put(5, 5, merge); }), 1);
    EXPECT_EQ(imagesFound(), 4);
}

TEST_F(TagFileCache, WhoServesWaitsLongerThanOneWhoReads)
{
    qputenv("KDD_READ_PATIENCE", "600000");
    ASSERT_TRUE(put(1, 2, write));
    for (const bool keepOpen : {false, true}) {
        TagFile holder;
        TagFile reader;
        ASSERT_TRUE(holder.readCacheFileForStudy(kStudy, true));
        auto serving = std::async(std::launch::async, [keepOpen] {
            TagFile file;
            return file.readWhenFreeForStudy(kStudy, keepOpen) && file.imagesByUID().size() == 2;
        });
        // Each gives up only when its time is over, so the one that serves has waited longer than that, too.
        EXPECT_FALSE(reader.readCacheFileForStudy(kStudy, false) ||
                     reader.readCacheFileForStudy(kStudy, true));
        EXPECT_TRUE(holder.close());
        EXPECT_TRUE(serving.get());
    }
    qunsetenv("KDD_READ_PATIENCE");
}

TEST_F(TagFileCache, IsOpenedOnlyOnce)
{
    const LogCapture log;
    ASSERT_TRUE(put(1, 2, write));
    TagFile file;
    ASSERT_TRUE(file.readCacheFileForStudy(kStudy, true));
    EXPECT_FALSE(file.readCacheFileForStudy(kStudy, false));
    EXPECT_EQ(log.count("Tag file already opened"), 1);
    EXPECT_EQ(file.imagesByUID().size(), 2);
    EXPECT_TRUE(file.close());
    EXPECT_FALSE(file.close());
    EXPECT_TRUE(file.readCacheFileForStudy(kStudy, false));
}

TEST_F(TagFileCache, AShorterStudyInAFileKeptOpenLeavesTheOldEnd)
{
    ASSERT_TRUE(put(1, 9, write));
    const QByteArray before = content();
    TagFile file;
    ASSERT_TRUE(file.readCacheFileForStudy(kStudy, true));
    for (const char* uid : {"2", "3", "4", "5", "6", "7", "8", "9"})
        file.removeImages(1, &uid);
    ASSERT_TRUE(file.writeCacheFile());
    EXPECT_EQ(content().right(100), before.right(100));
    EXPECT_EQ(content().size(), before.size());
    EXPECT_EQ(imagesFound(), 1);
    ASSERT_TRUE(file.writeCacheFile()) << "not open any more, so made anew";
    EXPECT_LT(content().size(), before.size());
    EXPECT_EQ(imagesFound(), 1);
}

TEST_F(TagFileCache, AnEmptyOneDeletesTheFileKeptOpen)
{
    ASSERT_TRUE(put(1, 2, write));
    TagFile file;
    EXPECT_FALSE(file.writeCacheFile()) << "nothing is open";
    ASSERT_TRUE(file.readCacheFileForStudy(kStudy, true));
    // What a write leaves that the device refused halfway would bring the study back.
    put(journal(), journalOf(content()));
    file.clear();
    EXPECT_TRUE(file.writeCacheFile());
    EXPECT_FALSE(QFile::exists(path()));
    EXPECT_TRUE(put(3, 3, merge)) << "nobody is locked out";
    EXPECT_EQ(imagesFound(), 1);
}

TEST_F(TagFileCache, AFullDiskLeavesTheOldFileWhole)
{
    ASSERT_TRUE(put(1, 4, write));
    const QByteArray before = content();
    for (const auto how : {write, merge}) {
        for (const bool keepOpen : {false, true}) {
            if (keepOpen && how == merge)
                continue;
            EXPECT_EQ(inChild([&] {
                          const LogCapture log;
                          TagFile file;
                          if (keepOpen && !file.readCacheFileForStudy(kStudy, true))
                              return false;
                          fill(file, 1, 9);
                          const FullDisk disk(before.size() + 50);
                          return !how(file) && !file.failure().isEmpty() && log.count(named("")) == 1 &&
                                 file.imagesByUID().size() == 9;
                      }),
                      1);
        }
    }
    EXPECT_EQ(content(), before);
    EXPECT_FALSE(QFile::exists(journal()));
}

TEST_F(TagFileCache, AFullDiskLeavesNoNewFile)
{
    const LogCapture log;
    for (const auto how : {write, merge}) {
        EXPECT_EQ(inChild([&] {
                      const FullDisk disk(100);
                      return !put(1, 3, how);
                  }),
                  1);
        EXPECT_FALSE(QFile::exists(path()) || QFile::exists(journal()));
    }
}

/// What a writer of images 1 to 9 left when it died after it had written so much of them over images 1 to 4.
struct Death
{
    const char* name;
    int writtenPercent;
    int journalCut;
    int images;  // to be found
};

const Death kDeaths[] = {
    {"BeforeTheFirstByte", 0, 0, 9},
    {"InTheMiddle", 50, 0, 9},
    {"AfterTheLastByte", 100, 0, 9},
    {"BeforeTheJournalWasWhole", 0, 1, 4},
    {"WhenTheJournalHadJustBegun", 0, 100000, 4},
};

TEST_F(TagFileCache, WhatADeadWriterLeftIsFinishedByWhoeverOpensTheFileNext)
{
    const std::function<int()> openers[] = {
        [] { return imagesFound(); },
        [] {
            TagFile file;
            return file.readCacheFileForStudy(kStudy, true) ? file.imagesByUID().size() : -1;
        },
        [] { return put(10, 10, merge) ? imagesFound() - 1 : -1; },
    };
    ASSERT_TRUE(put(1, 9, write));
    const QByteArray wanted = content();
    ASSERT_TRUE(put(1, 4, write));
    const QByteArray former = content();
    const auto die = [&](const Death& death, const QByteArray& before) {
        const int done = wanted.size() * death.writtenPercent / 100;
        put(path(), wanted.left(done) + before.mid(done));
        QByteArray left = journalOf(wanted);
        left.chop(death.journalCut);
        put(journal(), left);
    };
    for (const Death& death : kDeaths) {
        for (const auto& images : openers) {
            die(death, former);
            EXPECT_EQ(images(), death.images) << death.name;
            EXPECT_FALSE(QFile::exists(journal())) << death.name;
        }
        die(death, "");
        EXPECT_TRUE(put(10, 10, merge));
        EXPECT_EQ(imagesFound(), death.images == 9 ? 10 : 1) << death.name << " of a new file";
        EXPECT_FALSE(QFile::exists(journal())) << death.name;
    }
}

TEST_F(TagFileCache, TheBytesOfAFolderNameSurvive)
{
    const std::filesystem::path folder = mStore.folder().toStdString() + "/m\xe9ta";
    TagFile::setMetaFolder(folder.c_str());
    TagFile file;
    add(file, anImage("1"));
    ASSERT_TRUE(file.writeCacheFile());
    TagFile more;
    add(more, anImage("2"));
    ASSERT_TRUE(more.mergeIntoCacheFile());
    TagFile again;
    ASSERT_TRUE(again.readCacheFileForStudy("1.2", true));
    EXPECT_EQ(again.imagesByUID().size(), 2);
    const std::filesystem::directory_iterator end;
    EXPECT_EQ(std::distance(std::filesystem::directory_iterator(folder.parent_path()), end), 1);
    EXPECT_TRUE(std::filesystem::exists(folder));
    again.clear();
    EXPECT_TRUE(again.writeCacheFile()) << "of nothing, which removes the file";
    EXPECT_FALSE(more.readCacheFileForStudy("1.2", false));
}

}  // namespace
