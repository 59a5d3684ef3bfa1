#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/TagMap.h"
#include "support/DatasetBuilder.h"
#include "support/LogCapture.h"
#include "support/TemporaryStore.h"
#include "support/TreeText.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <ctime>
#include <functional>
#include <map>
#include <memory>
#include <random>
#include <vector>

using namespace Kdd;

namespace
{

using Shown = std::map<std::string, std::string>;

const char* const kStudy = "1.2";

TagMap* add(TagFile& file, const DatasetBuilder& image)
{
    return file.addTagMap(image.map(), nullptr, true);
}

std::string shownAlone(const DatasetBuilder& image)
{
    return shownText(*std::unique_ptr<TagMap>(image.map()));
}

Shown shownBy(const TagFile& file)
{
    Shown shown;
    for (auto it = file.imagesByUID().cbegin(); it != file.imagesByUID().cend(); ++it)
        shown[it.key().toStdString()] = shownText(*it.value());
    return shown;
}

class TagFileMerge : public testing::Test
{
protected:
    static QString path() { return TagFile::cacheFilePathForStudy(kStudy); }

    static QByteArray content()
    {
        QFile file(path());
        return file.open(QIODevice::ReadOnly) ? file.readAll() : QByteArray("(no file)");
    }

    static void put(const QByteArray& bytes)
    {
        QDir().mkpath(QFileInfo(path()).path());
        QFile file(path());
        ASSERT_TRUE(file.open(QIODevice::WriteOnly));
        ASSERT_EQ(file.write(bytes), bytes.size());
    }

    static bool merge(const std::vector<DatasetBuilder>& images)
    {
        TagFile file;
        for (const DatasetBuilder& image : images)
            add(file, image);
        return file.mergeIntoCacheFile();
    }

    static Shown shownByFile()
    {
        TagFile file;
        EXPECT_TRUE(file.readCacheFileForStudy(kStudy, false));
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

    TemporaryStore mStore;
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
    ASSERT_TRUE(again.readCacheFileForStudy(kStudy, false));
    EXPECT_EQ(treeText(again), tree);
}

TEST_F(TagFileMerge, ReplacesWhatIsMergedAgainAndKeepsTheRest)
{
    const DatasetBuilder first = anImage("1").with(DCM_PatientID, "p").with(DCM_ImageComments, "old");
    const DatasetBuilder second = anImage("2").with(DCM_PatientID, "p");
    const DatasetBuilder third = anImage("3").inSeries("1.2.4").with(DCM_Modality, "MR");
    ASSERT_TRUE(merge({first, second, third}));
    const DatasetBuilder again = anImage("1").with(DCM_PatientID, "q").with(DCM_ImageComments, "new");
    const DatasetBuilder moved = anImage("3").inSeries("1.2.5");
    ASSERT_TRUE(merge({again, moved}));
    EXPECT_EQ(shownByFile(),
              (Shown{{"1", shownAlone(again)}, {"2", shownAlone(second)}, {"3", shownAlone(moved)}}));
    TagFile file;
    ASSERT_TRUE(file.readCacheFileForStudy(kStudy, false));
    EXPECT_EQ(file.seriesByUID().keys(), (QList<QByteArray>{"1.2.3", "1.2.5"}))
        << "what became empty is gone";
}

TEST_F(TagFileMerge, TheObjectHoldsTheWholeStudyAfterwards)
{
    ASSERT_TRUE(merge({anImage("1"), anImage("2").inSeries("1.2.4")}));
    TagFile file;
    add(file, anImage("3"));
    ASSERT_TRUE(file.mergeIntoCacheFile());
    TagFile again;
    ASSERT_TRUE(again.readCacheFileForStudy(kStudy, false));
    EXPECT_EQ(file.imagesByUID().size(), 3);
    EXPECT_EQ(treeText(file), treeText(again));
    EXPECT_TRUE(file.failure().isEmpty());
}

TEST_F(TagFileMerge, ASeriesLeftEmptyIsNotMerged)
{
    ASSERT_TRUE(merge({anImage("1")}));
    TagFile file;
    add(file, anImage("2"));
    add(file, anImage("3").inSeries("1.2.4"));
    delete file.takeImage("3");
    ASSERT_TRUE(file.mergeIntoCacheFile());
    EXPECT_EQ(file.seriesByUID().keys(), QList<QByteArray>{"1.2.3"});
    EXPECT_EQ(shownByFile().size(), 2U);
}

TEST_F(TagFileMerge, NothingHeldIsNothingToMerge)
{
    const LogCapture log;
    EXPECT_FALSE(TagFile().mergeIntoCacheFile());
    EXPECT_EQ(log.lines(), std::vector<std::string>{"No images, cannot update tag file"});
}

TEST_F(TagFileMerge, AFileOfAnotherStudyIsLeftAlone)
{
    TagFile other;
    add(other, anImage("1").inStudy("1.2.0"));
    ASSERT_TRUE(other.writeCacheFile(path().toLocal8Bit().constData()));
    expectRefusal("Tag file " + path().toStdString() + " contains wrong study, expected 1.2");
}

TEST_F(TagFileMerge, ADamagedFileIsLeftAlone)
{
    ASSERT_TRUE(merge({anImage("2")}));
    put(content().left(40));
    expectRefusal("Could not read tag file " + path().toStdString());
    put("no tag file");
    expectRefusal("Could not read tag file " + path().toStdString());
}

TEST_F(TagFileMerge, SaysWhichFolderCannotBeMade)
{
    TagFile::setMetaFolder("/proc/kdd");
    expectRefusal("Could not create meta folder " + QFileInfo(path()).path().toStdString());
    QFile inPlace(mStore.filePath("file"));
    ASSERT_TRUE(inPlace.open(QIODevice::WriteOnly));
    TagFile::setMetaFolder(inPlace.fileName().toLocal8Bit().constData());
    expectRefusal("Could not create meta folder " + QFileInfo(path()).path().toStdString());
}

TEST_F(TagFileMerge, SaysWhyAFileCannotBeOpened)
{
    QDir().mkpath(path());
    expectRefusal("Could not open " + path().toStdString() + " for read-write: error code 21");
}

// What images show must not change by what they share with others, sequences above all: items inherit from items.

DatasetBuilder anItemOf(const char* value)
{
    return anItem().with(DCM_CodeValue, value).with(DCM_CodeMeaning, "same");
}

TEST_F(TagFileMerge, SequencesThatAreEqualInPartStayWhatTheyWere)
{
    const DatasetBuilder nested = anItemOf("n").withItem(DCM_ReferencedSOPSequence, anItemOf("deep"));
    const DatasetBuilder images[] = {
        anImage("1").withItem(DCM_OriginalAttributesSequence, nested),
        anImage("2")
            .withItem(DCM_OriginalAttributesSequence, nested)
            .withItem(DCM_OriginalAttributesSequence, anItemOf("b")),
        anImage("3").withItem(DCM_OriginalAttributesSequence,
                              anItemOf("c").withItem(DCM_ReferencedSOPSequence, anItem())),
        anImage("4").inSeries("1.2.4").withItem(DCM_OriginalAttributesSequence, anItemOf("n")),
        anImage("5").with(new DcmSequenceOfItems(DCM_OriginalAttributesSequence)),
        anImage("6"),
    };
    Shown expected;
    for (const DatasetBuilder& image : images) {
        ASSERT_TRUE(merge({image}));
        OFString uid;
        image.dataset().findAndGetOFString(DCM_SOPInstanceUID, uid);
        expected[uid.c_str()] = shownAlone(image);
        ASSERT_EQ(shownByFile(), expected);
    }
    ASSERT_TRUE(merge({images[5], images[2], images[0]}));
    EXPECT_EQ(shownByFile(), expected);
}

/// Images with few attributes of few values, so that they share much and differ everywhere.
class RandomImages
{
public:
    explicit RandomImages(unsigned seed)
        : mRandom(seed)
    {
    }

    int pick(int count) { return static_cast<int>(mRandom() % static_cast<unsigned>(count)); }

    DatasetBuilder image(const QByteArray& uid)
    {
        DatasetBuilder image = anImage(uid.constData());
        image.inSeries(pick(3) == 0 ? "1.2.4" : "1.2.3");
        addSome(image, {DCM_PatientName, DCM_PatientID, DCM_ImageComments, DCM_SeriesDescription});
        // Of each sequence there are few kinds, so that equal ones meet in different images and series.
        for (const DcmTagKey& sequence :
             {DCM_OriginalAttributesSequence, DCM_ReferencedSeriesSequence, DCM_RequestAttributesSequence})
            RandomImages(static_cast<unsigned>(pick(5))).addItems(image, sequence, 2);
        return image;
    }

private:
    void addSome(DatasetBuilder& item, std::initializer_list<DcmTagKey> keys)
    {
        const char* const values[] = {"a", "b", ""};
        for (const DcmTagKey& key : keys) {
            if (pick(3) != 0)
                item.with(key, values[pick(3)]);
        }
    }

    void addItems(DatasetBuilder& item, const DcmTagKey& sequence, int depth)
    {
        if (pick(4) == 0)
            item.with(new DcmSequenceOfItems(sequence));
        for (int i = pick(4); i > 0; --i) {
            DatasetBuilder below = anItem();
            addSome(below, {DCM_CodeValue, DCM_CodeMeaning});
            if (depth > 0)
                addItems(below, DCM_ReferencedSOPSequence, depth - 1);
            item.withItem(sequence, below);
        }
    }

    std::mt19937 mRandom;
};

class RandomMerges : public TagFileMerge, public testing::WithParamInterface<unsigned>
{
};

TEST_P(RandomMerges, NeverChangeWhatAnImageShows)
{
    RandomImages random(GetParam());
    Shown expected;
    for (int round = 0; round < 4; ++round) {
        TagFile file;
        for (int i = random.pick(8); i >= 0; --i) {
            const QByteArray uid = QByteArray::number(random.pick(12));
            const DatasetBuilder image = random.image(uid);
            add(file, image);
            expected[uid.toStdString()] = shownAlone(image);
        }
        if (random.pick(2) == 0)
            file.optimizeAll();
        ASSERT_TRUE(file.mergeIntoCacheFile());
        ASSERT_EQ(shownBy(file), expected);
        ASSERT_EQ(shownByFile(), expected);
    }
    TagFile file;
    ASSERT_TRUE(file.readCacheFileForStudy(kStudy, false));
    for (const QByteArray& uid : file.imagesByUID().keys()) {
        const std::unique_ptr<TagMap> taken(file.takeImage(uid));
        EXPECT_EQ(shownText(*taken), expected[uid.toStdString()]);
        expected.erase(uid.toStdString());
        ASSERT_EQ(shownBy(file), expected);
    }
}

INSTANTIATE_TEST_SUITE_P(Seeds, RandomMerges, testing::Range(1U, 41U));

// Several processes at once.

constexpr int kProcesses = 8;
constexpr int kImagesEach = 10;

std::string uidOf(int process, int image)
{
    return std::to_string(100 * (process + 1) + image);
}

DatasetBuilder partOf(int process, int image)
{
    RandomImages random(static_cast<unsigned>(100 * process + image));
    return random.image(QByteArray::fromStdString(uidOf(process, image)));
}

/// One process' part of the study, merged in two goes, each again while the others hold the file.
bool mergePart(int process)
{
    for (int first = 0; first < kImagesEach; first += kImagesEach / 2) {
        TagFile file;
        for (int image = first; image < first + kImagesEach / 2; ++image)
            add(file, partOf(process, image));
        while (!file.mergeIntoCacheFile()) {
            if (!file.wasLockedOut())
                return false;
        }
    }
    return true;
}

void dieIn(long microseconds)
{
    sigevent death = {};
    death.sigev_notify = SIGEV_SIGNAL;
    death.sigev_signo = SIGKILL;
    timer_t timer = nullptr;
    const itimerspec moment = {{0, 0}, {0, microseconds * 1000 + 1}};
    if (::timer_create(CLOCK_MONOTONIC, &death, &timer) != 0 ||
        ::timer_settime(timer, 0, &moment, nullptr) != 0)
        ::_exit(2);
}

class ConcurrentMerges : public TagFileMerge
{
protected:
    ConcurrentMerges()
    {
        for (int process = 0; process < kProcesses; ++process) {
            for (int image = 0; image < kImagesEach; ++image)
                mExpected[uidOf(process, image)] = shownAlone(partOf(process, image));
        }
    }

    /// Lets all processes merge their parts at once into a store that is still empty, and reads all the while.
    void mergeAll(int victim = -1, long lifetime = -1)
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
            EXPECT_TRUE(process == victim || (WIFEXITED(status) && WEXITSTATUS(status) == 0)) << process;
        }
    }

    /// Whether nothing is in the file that should not be there; counts what is missing of each process.
    void expectAllBut(int victim)
    {
        const Shown found = shownByFile();
        for (const auto& [uid, shown] : mExpected) {
            const auto at = found.find(uid);
            if (at != found.end())
                EXPECT_EQ(at->second, shown) << uid;
            else
                EXPECT_EQ(std::stoi(uid) / 100 - 1, victim) << uid << " is lost";
        }
    }

    Shown mExpected;

private:
    static pid_t start(int process, const int (&gate)[2], long lifetime)
    {
        const pid_t pid = ::fork();
        if (pid != 0)
            return pid;
        char nothing = 0;
        ::close(gate[1]);
        if (::read(gate[0], &nothing, 1) != 0)
            ::_exit(2);
        if (lifetime >= 0)
            dieIn(lifetime);
        ::_exit(mergePart(process) ? 0 : 1);
    }

    void readOnce()
    {
        const LogCapture log;
        TagFile file;
        if (!file.readCacheFileForStudy(kStudy, false)) {
            EXPECT_TRUE(file.wasLockedOut() || log.lines().empty()) << log.lines().back();
            return;
        }
        for (const auto& [uid, shown] : shownBy(file))
            ASSERT_EQ(shown, mExpected[uid]);
    }
};

TEST_F(ConcurrentMerges, LoseNothing)
{
    for (int round = 0; round < 3; ++round) {
        mergeAll();
        ASSERT_EQ(shownByFile(), mExpected);
    }
}

TEST_F(ConcurrentMerges, LoseNothingButWhatAKilledOneHadNotMerged)
{
    std::mt19937 random(1);
    for (int round = 0; round < 6; ++round) {
        mergeAll(round, static_cast<long>(random() % 120000));
        expectAllBut(round);
        ASSERT_TRUE(mergePart(round)) << "the second run";
        ASSERT_EQ(shownByFile(), mExpected);
        ASSERT_FALSE(QFile::exists(path() + QStringLiteral(".journal")));
    }
}

}  // namespace
