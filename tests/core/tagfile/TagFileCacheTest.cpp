#include "TagFileFixture.h"
#include "kddlib/tagfile/StudyFile.h"
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
    /// Adds images whose values cannot be compressed much, so that more images always take more room.
    static void fill(TagFile& file, int from, int to)
    {
        for (int i = from; i <= to; ++i) {
            DatasetBuilder image = anImage(QByteArray::number(i));
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

TEST_F(TagFileCache, SaysWhatCannotBeReadOrWritten)
{
    const LogCapture log;
    TagFile file;
    EXPECT_FALSE(file.readCacheFileForStudy(kStudy, false) || file.readCacheFileForStudy(kStudy, true));
    EXPECT_FALSE(file.failure().isEmpty() || file.wasLockedOut());
    EXPECT_TRUE(log.lines().empty()) << "an absent file is no fault";
    put(path(), "no tag file");
    EXPECT_FALSE(file.readCacheFileForStudy(kStudy, true));
    EXPECT_EQ(log.count(named("Could not read ")), 1);
    EXPECT_FALSE(file.close());
    fill(file, 1, 1);
    EXPECT_FALSE(file.writeCacheFile("/proc/kdd/file.tc"));
    EXPECT_EQ(log.count("Could not open /proc/kdd/file.tc for writing"), 1);
    EXPECT_EQ(file.imagesByUID().size(), 1);
}

TEST_F(TagFileCache, WhoKeepsItOpenLocksOthersOut)
{
    ASSERT_TRUE(put(1, 2, write));
    TagFile file;
    ASSERT_TRUE(file.readCacheFileForStudy(kStudy, true));
    EXPECT_FALSE(file.readCacheFileForStudy(kStudy, false)) << "it is open already";
    EXPECT_EQ(file.imagesByUID().size(), 2);
    const std::pair<bool (*)(TagFile&), const char*> others[] = {
        {[](TagFile& other) { return other.readCacheFileForStudy(kStudy, false); }, ": "},
        {[](TagFile& other) { return other.readCacheFileForStudy(kStudy, true); }, nullptr},
        {[](TagFile& other) { return merge(other) || other.imagesByUID().size() != 1; },
         " for read-write: error code "}};
    for (const auto& [operation, ending] : others) {
        const auto isLockedOut = [&operation = operation, &ending = ending] {
            const LogCapture log;
            TagFile other;
            fill(other, 3, 3);
            return !operation(other) && other.wasLockedOut() && !other.failure().isEmpty() &&
                   (ending == nullptr || log.count(named("Could not open ") + ending) == 1);
        };
        EXPECT_EQ(inChild(isLockedOut), 1);
    }
    fill(file, 4, 4);
    EXPECT_TRUE(file.writeCacheFile());
    EXPECT_EQ(inChild([] { return put(5, 5, merge); }), 1);
    EXPECT_EQ(imagesFound(), 4);
    EXPECT_FALSE(file.close()) << "not open any more";
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

TEST_F(TagFileCache, AShorterStudyInAFileKeptOpenLeavesTheOldEndWhichNoStampCounts)
{
    const LogCapture log;
    TagFile file;
    EXPECT_FALSE(file.readStampedWhenFree(path(), kStudy));
    EXPECT_TRUE(file.stamp() == Kxg::TagFileStamp());
    ASSERT_TRUE(put(1, 9, write));
    const QByteArray before = content();
    ASSERT_TRUE(file.readCacheFileForStudy(kStudy, true));
    for (const char* uid : {"2", "3", "4", "5", "6", "7", "8", "9"})
        file.removeImages(1, &uid);
    ASSERT_TRUE(file.writeCacheFile());
    EXPECT_EQ(content().right(100), before.right(100));
    EXPECT_EQ(content().size(), before.size());
    EXPECT_EQ(imagesFound(), 1);
    TagFile again;
    ASSERT_TRUE(again.readStampedWhenFree(path(), kStudy));
    EXPECT_TRUE(again.stamp() == file.stamp());
    EXPECT_FALSE(again.stamp().digest.isEmpty());
    ASSERT_TRUE(file.writeCacheFile()) << "not open any more, so made anew";
    EXPECT_LT(content().size(), before.size());
    EXPECT_EQ(imagesFound(), 1);
    ASSERT_TRUE(put(10, 10, merge));
    ASSERT_TRUE(again.readStampedWhenFree(path(), kStudy));
    EXPECT_FALSE(again.stamp() == file.stamp());
}

TEST_F(TagFileCache, AnEmptyOneDeletesTheFileKeptOpenAndNoCopyWrittenElsewhere)
{
    ASSERT_TRUE(put(1, 2, write));
    const QString elsewhere = mStore.filePath("elsewhere.tc");
    TagFile file;
    EXPECT_FALSE(file.writeCacheFile()) << "nothing is open";
    ASSERT_TRUE(file.readCacheFileForStudy(kStudy, true));
    ASSERT_TRUE(file.writeCacheFile(elsewhere.toLocal8Bit().constData()));
    // What a write leaves that the device refused halfway would bring the study back.
    put(journal(), journalOf(content()));
    file.clear();
    EXPECT_TRUE(file.writeCacheFile());
    EXPECT_FALSE(QFile::exists(path()));
    EXPECT_TRUE(QFile::exists(elsewhere));
    EXPECT_TRUE(put(3, 3, merge)) << "nobody is locked out";
    EXPECT_EQ(imagesFound(), 1);
}

TEST_F(TagFileCache, AFullDiskLeavesTheOldFileWholeAndNoNewOne)
{
    const auto isRefused = [](qint64 size, bool keepOpen, bool (*how)(TagFile&)) {
        const LogCapture log;
        TagFile file;
        if (keepOpen && !file.readCacheFileForStudy(kStudy, true))
            return false;
        fill(file, 1, 9);
        const FullDisk disk(size + 50);
        return !how(file) && !file.failure().isEmpty() && log.count(named("")) == 1 &&
               file.imagesByUID().size() == 9;
    };
    for (const auto how : {write, merge}) {
        EXPECT_EQ(inChild([&] { return isRefused(0, false, how); }), 1);
        EXPECT_FALSE(QFile::exists(path()) || QFile::exists(journal()));
    }
    ASSERT_TRUE(put(1, 4, write));
    const QByteArray before = content();
    for (const auto& [keepOpen, how] : {std::pair(false, &write), {true, write}, {false, merge}})
        EXPECT_EQ(
            inChild([&, keepOpen = keepOpen, how = how] { return isRefused(before.size(), keepOpen, how); }),
            1);
    EXPECT_EQ(content(), before);
    EXPECT_FALSE(QFile::exists(journal()));
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
    EXPECT_TRUE(put(1, 1, write) && put(2, 2, merge));
    EXPECT_EQ(imagesFound(), 2);
    EXPECT_GT(std::filesystem::remove_all(folder), 0U);
}

TEST_F(TagFileCache, OneMadeInVainGoesUnlessAJournalIsItsContent)
{
    for (const bool isPromised : {false, true}) {
        StudyFile file;
        ASSERT_TRUE(file.open(path(), StudyFile::Access::HoldOrMake));
        if (isPromised)
            put(journal(), journalOf("content"));
        file.removeIfNeverWritten();
        EXPECT_EQ(QFile::exists(path()), isPromised);
    }
}

}  // namespace
