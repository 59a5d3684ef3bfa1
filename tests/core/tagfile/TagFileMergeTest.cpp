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

using Shown = std::map<std::string, std::string>;

class TagFileMerge : public TagFileTest
{
protected:
    static bool merge(const std::vector<DatasetBuilder>& images)
    {
        TagFile file;
        for (const DatasetBuilder& image : images)
            add(file, image);
        return file.mergeIntoCacheFile();
    }

    static Shown shownBy(const TagFile& file)
    {
        Shown shown;
        for (auto it = file.imagesByUID().cbegin(); it != file.imagesByUID().cend(); ++it)
            shown[it.key().toStdString()] = shownText(*it.value());
        return shown;
    }

    static Shown shownByFile()
    {
        TagFile file;
        EXPECT_TRUE(file.readCacheFileForStudy("1.2", false));
        return shownBy(file);
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

TEST_F(TagFileMerge, IntoAMissingFileWritesTheTreeAsItIs)
{
    TagFile file;
    // The second comment would be better kept by the series, but nothing is moved.
    for (const char* uid : {"1", "2", "3"})
        add(file, anImage(uid).with(DCM_ImageComments, *uid == '1' ? "one" : "many"));
    const std::string tree = treeText(file);
    ASSERT_TRUE(file.mergeIntoCacheFile());
    EXPECT_EQ(treeText(file), tree);
    TagFile again;
    ASSERT_TRUE(again.readCacheFileForStudy("1.2", false));
    EXPECT_EQ(treeText(again), tree);
}

TEST_F(TagFileMerge, ReplacesWhatIsMergedAgainAndKeepsTheRest)
{
    const DatasetBuilder first = anImage("1").with(DCM_PatientID, "p").with(DCM_ImageComments, "old");
    const DatasetBuilder second = anImage("2").with(DCM_PatientID, "p");
    ASSERT_TRUE(merge({first, second, anImage("3").inSeries("1.2.4").with(DCM_Modality, "MR")}));
    const DatasetBuilder again = anImage("1").with(DCM_PatientID, "q").with(DCM_ImageComments, "new");
    const DatasetBuilder moved = anImage("3").inSeries("1.2.5");
    ASSERT_TRUE(merge({again, moved}));
    EXPECT_EQ(shownByFile(),
              (Shown{{"1", shownAlone(again)}, {"2", shownAlone(second)}, {"3", shownAlone(moved)}}));
    TagFile file;
    ASSERT_TRUE(file.readCacheFileForStudy("1.2", false));
    EXPECT_EQ(file.seriesByUID().keys(), (Uids{"1.2.3", "1.2.5"})) << "what became empty is gone";
}

TEST_F(TagFileMerge, ASeriesLeftEmptyIsNotMerged)
{
    ASSERT_TRUE(merge({anImage("1")}));
    TagFile file;
    add(file, anImage("2"));
    add(file, anImage("3").inSeries("1.2.4"));
    delete file.takeImage("3");
    ASSERT_TRUE(file.mergeIntoCacheFile());
    EXPECT_EQ(file.seriesByUID().keys(), Uids{"1.2.3"});
    EXPECT_EQ(shownByFile().size(), 2U);
}

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
    put(mStore.filePath("file"), "in place of a folder");
    for (const QString& folder : {QStringLiteral("/proc/kdd"), mStore.filePath("file")}) {
        TagFile::setMetaFolder(folder.toLocal8Bit().constData());
        expectRefusal("Could not create meta folder " + QFileInfo(path()).path().toStdString());
    }
    const LogCapture log;
    EXPECT_FALSE(TagFile().mergeIntoCacheFile());
    EXPECT_EQ(log.lines(), std::vector<std::string>{"No images, cannot update tag file"});
}

// What images show must not change by what they share with others, sequences above all: items inherit from items.

TEST_F(TagFileMerge, SequencesThatAreEqualInPartStayWhatTheyWere)
{
    const DcmTagKey key = DCM_OriginalAttributesSequence;
    const DatasetBuilder deep = anItem().with(DCM_CodeValue, "d").with(DCM_CodeMeaning, "same");
    const DatasetBuilder nested =
        anItem().with(DCM_CodeMeaning, "same").withItem(DCM_ReferencedSOPSequence, deep);
    const DatasetBuilder bare =
        anItem().with(DCM_CodeValue, "n").withItem(DCM_ReferencedSOPSequence, anItem());
    const std::map<std::string, DatasetBuilder> images = {
        {"1", anImage("1").withItem(key, nested)},
        {"2", anImage("2").withItem(key, nested).withItem(key, deep)},
        {"3", anImage("3").withItem(key, bare)},
        {"4", anImage("4").inSeries("1.2.4").withItem(key, deep)},
        {"5", anImage("5").with(new DcmSequenceOfItems(key))},
        {"6", anImage("6")},
    };
    Shown expected;
    for (const auto& [uid, image] : images) {
        ASSERT_TRUE(merge({image}));
        expected[uid] = shownAlone(image);
        ASSERT_EQ(shownByFile(), expected);
    }
    ASSERT_TRUE(merge({images.at("6"), images.at("3"), images.at("1")}));
    EXPECT_EQ(shownByFile(), expected);
}

constexpr int kProcesses = 8;
constexpr int kImagesEach = 10;

/// One study, merged by several processes at once.
class ConcurrentMerges : public TagFileMerge
{
protected:
    ConcurrentMerges()
    {
        for (int image = 0; image < kProcesses * kImagesEach; ++image)
            mExpected[uidOf(image)] = shownText(*std::unique_ptr<TagMap>(imageOf(image)));
    }

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
                readOnce();
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

    /// Whether every image in the file is right and only the victim's are missing.
    void expectAllBut(int victim)
    {
        Shown found = shownByFile();
        for (int image = 0; image < kProcesses * kImagesEach; ++image) {
            if (image / kImagesEach == victim && found.count(uidOf(image)) == 0)
                found[uidOf(image)] = mExpected[uidOf(image)];
        }
        EXPECT_EQ(found, mExpected);
    }

    Shown mExpected;

private:
    static std::string uidOf(int image) { return std::to_string(100 + image); }

    static TagMap* imageOf(int image)
    {
        RandomImages random(static_cast<unsigned>(image));
        random.change(10);
        return random.next(QByteArray::fromStdString(uidOf(image)));
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

    /// The file may be absent or held by others, but what is read is right.
    void readOnce()
    {
        const LogCapture log;
        TagFile file;
        if (!file.readCacheFileForStudy("1.2", false)) {
            EXPECT_TRUE(file.wasLockedOut() || log.lines().empty()) << log.lines().back();
        }
        for (const auto& [uid, shown] : shownBy(file))
            ASSERT_EQ(shown, mExpected[uid]);
    }
};

TEST_F(ConcurrentMerges, LoseNothingButWhatAKilledOneHadNotMerged)
{
    std::mt19937 random(1);
    // The last number is none of them: nobody dies.
    for (const int victim : {0, 1, 2, 3, kProcesses}) {
        mergeAll(victim, static_cast<long>(random() % 120000));
        expectAllBut(victim);
        ASSERT_TRUE(victim == kProcesses || mergePart(victim)) << "the second run";
        ASSERT_EQ(shownByFile(), mExpected);
        ASSERT_FALSE(QFile::exists(journal()));
    }
}

/// Labels and marks of a study and its series are theirs alone.
TEST_F(TagFileMerge, ImagesHoldNothingThatTheirSeriesSaysOfItself)
{
    const DcmTagKey ofTheNode[] = {kFromDatabase, kHasVolumeFile, kAbstract};
    const auto mark = [&](TagFile& file) {
        file.study()->putAndInsertInt(ofTheNode[0], 1);
        file.seriesByUID().first()->putAndInsertInt(ofTheNode[1], 1);
        file.createAbstractTags();
    };
    for (const int numFresh : {1, 9}) {
        TagFile stored;
        for (int i = 0; i < 4; ++i)
            add(stored, anImage(QByteArray::number(i).constData()));
        add(stored, anImage("s").inSeries("1.2.9"));
        mark(stored);
        ASSERT_TRUE(stored.writeCacheFile());
        TagFile fresh;
        for (int i = 0; i < numFresh; ++i)
            add(fresh, anImage(("f" + QByteArray::number(i)).constData()));
        mark(fresh);
        ASSERT_TRUE(fresh.mergeIntoCacheFile());
        for (const TagMap* image : fresh.imagesByUID()) {
            for (const DcmTagKey& key : ofTheNode)
                EXPECT_FALSE(image->tagsForLevel().contains(key)) << numFresh << key.toString();
        }
        EXPECT_NE(fresh.findImage("f0")->findElement(ofTheNode[1]), nullptr) << "it inherits the mark";
        EXPECT_EQ(fresh.findImage("s")->findElement(ofTheNode[1]), nullptr);
        EXPECT_TRUE(fresh.study()->tagsForLevel().contains(ofTheNode[0]));
    }
}

}  // namespace
