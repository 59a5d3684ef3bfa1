#include "TagFileFixture.h"
#include "support/RandomImages.h"

#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <ctime>
#include <random>
#include <vector>

using namespace Kdd;

namespace
{

class TagFileMerge : public TagFileTest
{
protected:
    /// So many images, which have the prefix and their number for UIDs.
    static void addImages(TagFile& file, const char* prefix, int count, const char* series = "1.2.3",
                          const char* part = "")
    {
        for (int i = 0; i < count; ++i)
            add(file,
                anImage(prefix + QByteArray::number(i)).inSeries(series).with(DCM_BodyPartExamined, part));
    }

    /// Merges one image that the present file does not let in.
    static void expectRefusal(const std::string& message)
    {
        const LogCapture log;
        const QByteArray before = content();
        TagFile file;
        add(file, anImage("1"));
        const std::string held = treeText(file);
        EXPECT_FALSE(file.mergeIntoCacheFile());
        EXPECT_EQ(log.count(message), 1) << message;
        EXPECT_FALSE(file.failure().isEmpty() || file.wasLockedOut());
        EXPECT_EQ(treeText(file), held);
        EXPECT_EQ(content(), before);
    }
};

TEST_F(TagFileMerge, WhatCannotBeMergedIsLeftAlone)
{
    TagFile other;
    add(other, anImage("1").inStudy("1.2.0"));
    ASSERT_TRUE(other.writeCacheFile(path().toLocal8Bit().constData()));
    expectRefusal(named("Tag file ") + " contains wrong study, expected 1.2");
    put(path(), content().left(40));
    expectRefusal(named("Could not read tag file "));
    QFile::remove(path());
    QDir().mkpath(path());
    expectRefusal(named("Could not open ") + " for read-write: error code 21");
    TagFile::setMetaFolder("/proc/kdd");
    expectRefusal("Could not create meta folder " + QFileInfo(path()).path().toStdString());
    const LogCapture log;
    TagFile empty;
    EXPECT_FALSE(empty.mergeIntoCacheFile() || empty.wasLockedOut());
    EXPECT_EQ(log.lines(), std::vector<std::string>{"No images, cannot update tag file"});
}

/// Labels and marks of a study and its series are theirs alone, whichever of the two series is the larger one.
TEST_F(TagFileMerge, ImagesHoldNothingThatTheirSeriesSaysOfItself)
{
    for (const int numFresh : {1, 9}) {
        TagFile stored;
        TagFile fresh;
        addImages(stored, "a", 4);
        addImages(stored, "s", 1, "1.2.9");
        addImages(fresh, "f", numFresh);
        for (TagFile* file : {&stored, &fresh}) {
            file->study()->putAndInsertInt(kFromDatabase, 1);
            file->findSeries("1.2.3")->putAndInsertInt(kHasVolumeFile, 1);
            file->createAbstractTags();
        }
        ASSERT_TRUE(stored.writeCacheFile() && fresh.mergeIntoCacheFile());
        for (const TagMap* image : fresh.imagesByUID()) {
            for (const DcmTagKey& key : {kFromDatabase, kHasVolumeFile, kAbstract})
                EXPECT_FALSE(image->tagsForLevel().contains(key)) << numFresh << key.toString();
        }
        EXPECT_NE(fresh.findImage("f0")->findElement(kHasVolumeFile), nullptr) << "it inherits the mark";
        EXPECT_EQ(fresh.findImage("s0")->findElement(kHasVolumeFile), nullptr);
        EXPECT_TRUE(fresh.study()->tagsForLevel().contains(kFromDatabase));
    }
}

TEST_F(TagFileMerge, WhatMostImagesShowStandsOnceWhenTheyHaveBecomeTheMost)
{
    TagFile stored;
    TagFile fresh;
    addImages(stored, "a", 3, "1.2.3", "CHEST");
    addImages(stored, "b", 2, "1.2.3", "PELVIS");
    addImages(fresh, "c", 2, "1.2.3", "PELVIS");
    stored.findSeries("1.2.3")->optimizeAll();
    ASSERT_TRUE(stored.writeCacheFile() && fresh.mergeIntoCacheFile());
    for (const TagMap* image : fresh.imagesByUID()) {
        const bool isOfTheFew = image->uid(TagMap::ImageLevel).startsWith('a');
        EXPECT_EQ(image->tagsForLevel().contains(DCM_BodyPartExamined), isOfTheFew);
        EXPECT_EQ(image->findElement(DCM_BodyPartExamined)->value(), isOfTheFew ? "CHEST" : "PELVIS");
    }
}

/// Only who built the file knows it; the images that come tell nothing of it.
TEST_F(TagFileMerge, ASeriesKeepsItsMarkOfAVolumeFileAndGivesItToNoOther)
{
    for (const int numFresh : {1, 9}) {
        TagFile stored;
        TagFile fresh;
        for (const char* seriesUID : {"1.2.3", "1.2.9"}) {
            addImages(stored, seriesUID, 4, seriesUID);
            stored.findSeries(seriesUID)->putAndInsertInt(kHasVolumeFile, 1);
        }
        stored.study()->optimizeAll();
        ASSERT_TRUE(stored.study()->tagsForLevel().contains(kHasVolumeFile)) << "all its series have one";
        addImages(fresh, "f", numFresh);
        addImages(fresh, "n", 1, "1.2.8");
        ASSERT_TRUE(stored.writeCacheFile() && fresh.mergeIntoCacheFile());
        for (const char* seriesUID : {"1.2.3", "1.2.9", "1.2.8"})
            EXPECT_EQ(fresh.findSeries(seriesUID)->findElement(kHasVolumeFile) != nullptr,
                      seriesUID[4] != '8');
    }
}

constexpr int kProcesses = 8;
constexpr int kImagesEach = 10;
constexpr int kAllImages = kProcesses * kImagesEach;

/// One study, merged by several processes at once.
class ConcurrentMerges : public TagFileTest
{
protected:
    ConcurrentMerges()
    {
        for (int image = 0; image < kAllImages; ++image)
            mExpected[uidOf(image)] = shownText(*std::unique_ptr<TagMap>(imageOf(image)));
    }

    static QByteArray uidOf(int image) { return QByteArray::number(100 + image); }

    /// Lets all processes merge their parts at once into a store that is still empty, and reads all the while.
    void mergeAll(int victim, long lifetime)
    {
        QDir(QString::fromLocal8Bit(TagFile::metaFolder())).removeRecursively();
        std::vector<pid_t> pids;
        int gate[2];
        ASSERT_EQ(::pipe(gate), 0);
        for (int process = 0; process < kProcesses; ++process)
            pids.push_back(start(process, gate, process == victim ? lifetime : -1));
        ::close(gate[0]);
        ::close(gate[1]);
        for (int process = 0; process < kProcesses; ++process) {
            int status = 0;
            while (::waitpid(pids[static_cast<std::size_t>(process)], &status, WNOHANG) == 0)
                imagesRead();
            EXPECT_TRUE(process == victim || status == 0) << process;
        }
    }

    /// A process' part, merged in two goes, each again while the others hold the file.
    static bool mergePart(int process)
    {
        const int end = (process + 1) * kImagesEach;
        for (int first = end - kImagesEach; first < end; first += kImagesEach / 2) {
            TagFile file;
            for (int image = first; image < first + kImagesEach / 2; ++image)
                file.addTagMap(imageOf(image), nullptr, true);
            while (!file.mergeIntoCacheFile()) {
                if (!file.wasLockedOut())
                    return false;
            }
        }
        return true;
    }

    /// The file may be absent or held by others, but what is read is right.
    Uids imagesRead()
    {
        const LogCapture log;
        TagFile file;
        const bool isRead = file.readCacheFileForStudy("1.2", false);
        EXPECT_TRUE(isRead || file.wasLockedOut() || log.lines().empty()) << log.lines().back();
        for (auto it = file.imagesByUID().cbegin(); it != file.imagesByUID().cend(); ++it)
            EXPECT_EQ(shownText(*it.value()), mExpected[it.key()]);
        return file.imagesByUID().keys();
    }

private:
    static TagMap* imageOf(int image)
    {
        RandomImages random(static_cast<unsigned>(image));
        random.change(10);
        return random.next(uidOf(image));
    }

    static pid_t start(int process, const int (&gate)[2], long lifetime)
    {
        const pid_t pid = ::fork();
        if (pid != 0)
            return pid;
        char nothing = 0;
        ::close(gate[1]);
        if (::read(gate[0], &nothing, 1) != 0 || (lifetime >= 0 && !dieIn(lifetime)))
            ::_exit(2);
        ::_exit(mergePart(process) ? 0 : 1);
    }

    static bool dieIn(long microseconds)
    {
        sigevent death = {};
        death.sigev_notify = SIGEV_SIGNAL;
        death.sigev_signo = SIGKILL;
        timer_t timer = nullptr;
        const itimerspec moment = {{0, 0}, {0, microseconds * 1000 + 1}};
        return ::timer_create(CLOCK_MONOTONIC, &death, &timer) == 0 &&
               ::timer_settime(timer, 0, &moment, nullptr) == 0;
    }

    std::map<QByteArray, std::string> mExpected;
};

TEST_F(ConcurrentMerges, LoseNothingButWhatAKilledOneHadNotMerged)
{
    std::mt19937 random(1);
    // The last number is none of them: nobody dies.
    for (const int victim : {0, 1, 2, 3, kProcesses}) {
        mergeAll(victim, static_cast<long>(random() % 120000));
        const Uids found = imagesRead();
        for (int image = 0; image < kAllImages; ++image)
            EXPECT_TRUE(found.contains(uidOf(image)) || image / kImagesEach == victim) << image;
        ASSERT_TRUE(victim == kProcesses || mergePart(victim)) << "the second run";
        ASSERT_EQ(imagesRead().size(), kAllImages);
        ASSERT_FALSE(QFile::exists(journal()));
    }
}

}  // namespace
