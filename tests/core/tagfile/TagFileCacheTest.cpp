#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/base/LogFile.h"
#include "support/DatasetBuilder.h"
#include "support/LogCapture.h"
#include "support/TemporaryStore.h"
#include "support/TreeText.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>
#include <QtEndian>

#include <gtest/gtest.h>
#include <libdeflate.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <functional>

using namespace Kdd;

namespace
{

const char* const kStudy = "1.2";

/// What `life` answers in a process of its own: 1 for true, 0 for false; the signal, negative, when that ended it.
int inChild(const std::function<bool()>& life)
{
    int status = 0;
    const pid_t pid = ::fork();
    if (pid == 0)
        ::_exit(life() ? 1 : 0);
    ::waitpid(pid, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
}

enum class WhenFull { Fail, Die };

/// From now on no file of this process can grow beyond `size`.
void fillDisk(qint64 size, WhenFull then)
{
    ::signal(SIGXFSZ, then == WhenFull::Fail ? SIG_IGN : SIG_DFL);
    const rlimit limit = {static_cast<rlim_t>(size), static_cast<rlim_t>(size)};
    ::setrlimit(RLIMIT_FSIZE, &limit);
}

void put(const QString& path, const QByteArray& content)
{
    QDir().mkpath(QFileInfo(path).path());
    QFile file(path);
    ASSERT_TRUE(file.open(QIODevice::WriteOnly));
    ASSERT_EQ(file.write(content), content.size());
}

QByteArray contentOf(const QString& path)
{
    QFile file(path);
    return file.open(QIODevice::ReadOnly) ? file.readAll() : QByteArray("(no file)");
}

/// The journal of a writer that was about to write the content.
QByteArray journalOf(const QByteArray& content)
{
    QByteArray bytes("KDDJRNL1............");
    const auto size = static_cast<size_t>(content.size());
    qToLittleEndian(quint64{size}, bytes.data() + 8);
    qToLittleEndian(libdeflate_crc32(0, content.constData(), size), bytes.data() + 16);
    return bytes + content;
}

class TagFileCache : public testing::Test
{
protected:
    void TearDown() override { LogFile::setLevel(LogFile::Level::Information); }

    static QString path() { return TagFile::cacheFilePathForStudy(kStudy); }
    static QString journal() { return path() + QStringLiteral(".journal"); }
    static std::string named(const char* message) { return message + path().toStdString(); }

    static void fill(TagFile& file, int from, int to)
    {
        // Values that cannot be compressed much, so that more images always take more room.
        for (int i = from; i <= to; ++i) {
            DatasetBuilder image = anImage(QByteArray::number(i).constData());
            for (int word = 1; word < 20; ++word)
                image.withItem(
                    DCM_RequestAttributesSequence,
                    anItem().with(DCM_CodeValue, QByteArray::number(i * word * 1103515245LL).right(12)));
            file.addTagMap(image.map(), nullptr, true);
        }
    }

    /// Writes a file of images 1 to `count`.
    static void build(int count)
    {
        TagFile file;
        fill(file, 1, count);
        ASSERT_TRUE(file.writeCacheFile());
    }

    /// How many images a reader finds; -1 when it finds no study.
    static int imagesFound()
    {
        TagFile file;
        return file.readCacheFileForStudy(kStudy, false) ? file.imagesByUID().size() : -1;
    }

    static bool merge(int from, int to)
    {
        TagFile file;
        fill(file, from, to);
        return file.mergeIntoCacheFile();
    }

    TemporaryStore mStore;
};

TEST_F(TagFileCache, ThePathIsTheDigestOfTheUidAndALineFeed)
{
    TagFile::setMetaFolder("/meta");
    EXPECT_EQ(TagFile::cacheFilePathForStudy("1.2.3"),
              QStringLiteral("/meta/e3/16/640a77b2a412ac0fe91cb85078c4.tc"));
    TagFile file;
    fill(file, 1, 1);
    EXPECT_EQ(file.cacheFilePath(), path());
}

TEST_F(TagFileCache, WhatIsWrittenIsFoundByItsStudy)
{
    TagFile file;
    fill(file, 1, 3);
    ASSERT_TRUE(file.writeCacheFile());
    TagFile again;
    ASSERT_TRUE(again.readCacheFileForStudy(kStudy, false));
    EXPECT_EQ(treeText(again), treeText(file));
    EXPECT_FALSE(again.close()) << "not kept open";
    const QByteArray elsewhere = mStore.filePath("some/where/else.tc").toLocal8Bit();
    ASSERT_TRUE(file.writeCacheFile(elsewhere.constData()));
    EXPECT_EQ(contentOf(QString::fromLocal8Bit(elsewhere)), contentOf(path()));
    EXPECT_FALSE(again.readCacheFile(path(), "1.2.0", false)) << "another study";
}

TEST_F(TagFileCache, AnAbsentFileIsWorthALineOnlyToWhoeverDebugs)
{
    const LogCapture log;
    TagFile file;
    EXPECT_FALSE(file.readCacheFileForStudy(kStudy, false));
    EXPECT_FALSE(file.readCacheFileForStudy(kStudy, true));
    EXPECT_TRUE(log.lines().empty());
    EXPECT_FALSE(file.failure().isEmpty());
    EXPECT_FALSE(file.wasLockedOut());
    LogFile::setLevel(LogFile::Level::Timing);
    EXPECT_FALSE(file.readCacheFileForStudy(kStudy, false));
    EXPECT_EQ(log.count(named("Could not open ")), 1);
}

TEST_F(TagFileCache, SaysWhatCannotBeRead)
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
}

TEST_F(TagFileCache, SaysWhatCannotBeWritten)
{
    const LogCapture log;
    TagFile file;
    fill(file, 1, 1);
    QDir().mkpath(path());
    EXPECT_FALSE(file.writeCacheFile());
    EXPECT_EQ(log.count(named("Could not open ") + " for writing"), 1);
    EXPECT_FALSE(file.writeCacheFile("/proc/kdd/file.tc"));
    EXPECT_EQ(log.count("Could not open /proc/kdd/file.tc for writing"), 1);
    EXPECT_FALSE(file.failure().isEmpty());
    EXPECT_EQ(file.imagesByUID().size(), 1);
}

TEST_F(TagFileCache, IsOpenedOnlyOnce)
{
    const LogCapture log;
    build(2);
    TagFile file;
    ASSERT_TRUE(file.readCacheFileForStudy(kStudy, true));
    EXPECT_FALSE(file.readCacheFileForStudy(kStudy, false));
    EXPECT_EQ(log.count("Tag file already opened"), 1);
    EXPECT_EQ(file.imagesByUID().size(), 2);
    EXPECT_TRUE(file.close());
    EXPECT_FALSE(file.close());
    EXPECT_TRUE(file.readCacheFileForStudy(kStudy, false));
}

TEST_F(TagFileCache, WhoKeepsItOpenLocksOthersOut)
{
    build(2);
    TagFile file;
    ASSERT_TRUE(file.readCacheFileForStudy(kStudy, true));
    const auto isLockedOut = [](const std::function<bool(TagFile&)>& operation) {
        TagFile other;
        fill(other, 3, 3);
        return !operation(other) && other.wasLockedOut() && !other.failure().isEmpty();
    };
    EXPECT_EQ(inChild([&] {
                  const LogCapture log;
                  return isLockedOut(
                             [](TagFile& other) { return other.readCacheFileForStudy(kStudy, false); }) &&
                         log.count(named("Could not open ")) == 1;
              }),
              1);
    EXPECT_EQ(inChild([&] {
                  return isLockedOut(
                      [](TagFile& other) { return other.readCacheFileForStudy(kStudy, true); });
              }),
              1);
    EXPECT_EQ(inChild([&] {
                  const LogCapture log;
                  return isLockedOut([](TagFile& other) {
                             return other.mergeIntoCacheFile() || other.imagesByUID().size() != 1;
                         }) &&
                         log.count(named("Could not open ") + " for read-write: error code ") == 1;
              }),
              1);
    fill(file, 4, 4);
    EXPECT_TRUE(file.writeCacheFile());
    EXPECT_EQ(inChild([] { return merge(5, 5); }), 1);
    EXPECT_EQ(imagesFound(), 4);
}

TEST_F(TagFileCache, AShorterStudyInAFileKeptOpenLeavesTheOldEnd)
{
    build(9);
    const QByteArray before = contentOf(path());
    TagFile file;
    ASSERT_TRUE(file.readCacheFileForStudy(kStudy, true));
    for (const char* uid : {"2", "3", "4", "5", "6", "7", "8", "9"})
        file.removeImages(1, &uid);
    ASSERT_TRUE(file.writeCacheFile());
    EXPECT_EQ(contentOf(path()).right(100), before.right(100));
    EXPECT_EQ(contentOf(path()).size(), before.size());
    EXPECT_EQ(imagesFound(), 1);
    ASSERT_TRUE(file.writeCacheFile()) << "not open any more, so made anew";
    EXPECT_LT(contentOf(path()).size(), before.size());
    EXPECT_EQ(imagesFound(), 1);
}

TEST_F(TagFileCache, AnEmptyOneDeletesTheFileKeptOpen)
{
    build(2);
    TagFile file;
    EXPECT_FALSE(file.writeCacheFile()) << "nothing is open";
    ASSERT_TRUE(file.readCacheFileForStudy(kStudy, true));
    // What a write leaves that the device refused halfway would bring the study back.
    put(journal(), journalOf(contentOf(path())));
    file.clear();
    EXPECT_TRUE(file.writeCacheFile());
    EXPECT_FALSE(QFile::exists(path()));
    EXPECT_FALSE(file.close());
    EXPECT_TRUE(merge(3, 3)) << "nobody is locked out";
    EXPECT_EQ(imagesFound(), 1);
}

bool writeWhole(TagFile& file)
{
    return file.writeCacheFile();
}

bool mergeWhole(TagFile& file)
{
    return file.mergeIntoCacheFile();
}

TEST_F(TagFileCache, AFullDiskLeavesTheOldFileWhole)
{
    build(4);
    const QByteArray before = contentOf(path());
    const auto fails = [&](bool keepOpen, bool (*write)(TagFile&)) {
        const LogCapture log;
        TagFile file;
        if (keepOpen && !file.readCacheFileForStudy(kStudy, true))
            return false;
        fill(file, 1, 9);
        fillDisk(before.size() + 50, WhenFull::Fail);
        return !write(file) && !file.failure().isEmpty() && log.count(path().toStdString()) == 1 &&
               file.imagesByUID().size() == 9;
    };
    EXPECT_EQ(inChild([&] { return fails(false, writeWhole); }), 1);
    EXPECT_EQ(inChild([&] { return fails(true, writeWhole); }), 1);
    EXPECT_EQ(inChild([&] { return fails(false, mergeWhole); }), 1);
    EXPECT_EQ(contentOf(path()), before);
    EXPECT_FALSE(QFile::exists(journal()));
    EXPECT_EQ(imagesFound(), 4);
}

TEST_F(TagFileCache, AFullDiskLeavesNoNewFile)
{
    for (const auto write : {writeWhole, mergeWhole}) {
        EXPECT_EQ(inChild([&] {
                      const LogCapture log;
                      TagFile file;
                      fill(file, 1, 3);
                      fillDisk(100, WhenFull::Fail);
                      return !write(file) && file.imagesByUID().size() == 3;
                  }),
                  1);
        EXPECT_FALSE(QFile::exists(path()));
        EXPECT_FALSE(QFile::exists(journal()));
    }
}

TEST_F(TagFileCache, AWriterThatDiesWhileItPreparesHasChangedNothing)
{
    build(4);
    const QByteArray before = contentOf(path());
    EXPECT_EQ(inChild([&] {
                  fillDisk(before.size() + 50, WhenFull::Die);
                  return merge(1, 9);
              }),
              -SIGXFSZ);
    EXPECT_TRUE(QFile::exists(journal()));
    EXPECT_EQ(imagesFound(), 4);
    EXPECT_EQ(contentOf(path()), before);
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

class DeadWriter : public TagFileCache, public testing::WithParamInterface<Death>
{
protected:
    void SetUp() override
    {
        build(9);
        const QByteArray wanted = contentOf(path());
        build(4);
        const QByteArray before = contentOf(path());
        const int done = wanted.size() * GetParam().writtenPercent / 100;
        put(path(), wanted.left(done) + before.mid(done));
        QByteArray left = journalOf(wanted);
        left.chop(GetParam().journalCut);
        put(journal(), left);
    }
};

TEST_P(DeadWriter, IsFinishedByTheNextReader)
{
    EXPECT_EQ(imagesFound(), GetParam().images);
    EXPECT_FALSE(QFile::exists(journal()));
    EXPECT_EQ(imagesFound(), GetParam().images);
}

TEST_P(DeadWriter, IsFinishedByWhoeverKeepsTheFileOpen)
{
    TagFile file;
    ASSERT_TRUE(file.readCacheFileForStudy(kStudy, true));
    EXPECT_EQ(file.imagesByUID().size(), GetParam().images);
    EXPECT_FALSE(QFile::exists(journal()));
}

TEST_P(DeadWriter, IsFinishedByTheNextMerge)
{
    EXPECT_TRUE(merge(10, 10));
    EXPECT_EQ(imagesFound(), GetParam().images + 1);
    EXPECT_FALSE(QFile::exists(journal()));
}

TEST_P(DeadWriter, OfANewFileIsFinishedToo)
{
    put(path(), "");
    EXPECT_TRUE(merge(10, 10));
    EXPECT_EQ(imagesFound(), GetParam().journalCut == 0 ? 10 : 1);
}

INSTANTIATE_TEST_SUITE_P(Deaths, DeadWriter, testing::ValuesIn(kDeaths),
                         [](const auto& row) { return std::string(row.param.name); });

}  // namespace
