#include "kddlib/archive/StudyProof.h"

#include "kddlib/archive/ArchiveDatabase.h"
#include "kddlib/archive/BackgroundCheck.h"
#include "kddlib/archive/DicomInput.h"
#include "kddlib/archive/StudyBuilders.h"
#include "kddlib/archive/StudyIntake.h"
#include "kddlib/archive/StudyStacker.h"
#include "kddlib/archive/WorkObserver.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/volumes/VolumeInfo.h"
#include "platform/database/StudyProofs.h"
#include "platform/volumefile/OrlanMesh.h"
#include "support/DatasetBuilder.h"
#include "support/EngineTest.h"
#include "support/FileContent.h"
#include "support/Setting.h"

#include <QFile>

#include <atomic>
#include <thread>

using namespace Kdd;

// HDF5 itself loses some memory with every damaged object header.
extern "C" __attribute__((visibility("default"))) const char* __lsan_default_suppressions()
{
    return "leak:libhdf5";
}

namespace
{

#ifdef __SANITIZE_ADDRESS__
constexpr int kStep = 41;  // every byte would take minutes there
#else
constexpr int kStep = 1;
#endif

DatasetBuilder aSlice(int number, const QByteArray& study = "1.1")
{
    return Kdd::aSlice(study + ".7." + QByteArray::number(number), number, number)
        .inStudy(study)
        .inSeries(study + ".1")
        .with(DCM_FrameOfReferenceUID, study);
}

/// All that readers are given of a volume file; empty when they are refused.
QByteArray shownOf(const QByteArray& path)
{
    Result result;
    const auto mesh = OrlanMesh::read(path, result);
    QByteArray shown;
    if (mesh == nullptr)
        return {};
    for (const Lattice& lattice : mesh->lattices()) {
        shown += lattice.name;
        for (int slice = 0; slice < lattice.dims.value(2, 1); ++slice) {
            TypedData2D pixels;
            if (mesh->readSlice(lattice, slice, pixels).bad())
                return {};
            shown += pixels.pixels;
        }
    }
    QVector<quint64> counts;
    if (mesh->readDataSection("Histogram", counts).bad())
        return {};
    for (const quint64 count : counts)
        shown += QByteArray::number(count) + ' ';
    return shown + dicomValue(*mesh, "G0020-000E");
}

class StudyProofTest : public EngineTest
{
protected:
    QString save(const DatasetBuilder& image, const char* name) const
    {
        const QString path = mFiles.filePath(QString::fromLatin1(name));
        image.save(path);
        return path;
    }

    void take(const QStringList& paths)
    {
        StudyIntake intake(*mCatalogue, mObserver);
        for (const QString& path : paths)
            ASSERT_TRUE(intake.take(readDicomInput(path.toUtf8(), Damage::Refused)).good());
        ASSERT_TRUE(intake.finish().good());
    }

    /// Study 1.1 with three images and a volume; study 1.2 with one image.
    void fill()
    {
        take({save(aSlice(1), "1"), save(aSlice(2), "2"), save(aSlice(3), "3"), save(aSlice(1, "1.2"), "4")});
        ASSERT_TRUE(StudyStacker(*mCatalogue, {mFiles.filePath(QStringLiteral("volumes"))}).stack("1.1"));
    }

    static QString tagFile(const char* study = "1.1") { return TagFile::cacheFilePathForStudy(study); }

    QByteArray volume()
    {
        QVector<QByteArray> paths;
        EXPECT_TRUE(mCatalogue->volumeFiles("1.1", paths).good());
        return paths.value(0);
    }

    /// What the proof tells of the study's tag file, or of its other files, in place of what was told before.
    StudyProof::Findings ofTagFile(bool heals = false)
    {
        StudyProof::Rules rules;
        rules.heals = heals;
        return proved(rules, [](StudyProof& proof) { return proof.checkTagFile("1.1"); });
    }
    StudyProof::Findings ofFiles(bool records = false, const char* study = "1.1")
    {
        StudyProof::Rules rules;
        rules.records = records;
        bool isDone = false;
        const StudyProof::Findings findings = proved(rules, [&](StudyProof& proof) {
            QByteArray position;
            return proof.checkFiles(study, position, isDone);
        });
        EXPECT_TRUE(isDone);
        return findings;
    }

    template <typename Check>
    StudyProof::Findings proved(const StudyProof::Rules& rules, const Check& check)
    {
        mTold.clear();
        StudyProof proof(*mCatalogue, rules,
                         [this](const QString& fault) { mTold += fault.toStdString() + '\n'; });
        EXPECT_TRUE(check(proof).good());
        return proof.findings();
    }

    bool isTold(const char* what) const { return mTold.find(what) != std::string::npos; }

    /// Calls `look` with a bit of the file flipped, for every byte or each that is so many later.
    template <typename Look>
    void forEachFlip(const QString& path, qint64 step, const Look& look)
    {
        for (qint64 at = 0; at < QFile(path).size() && !HasFatalFailure(); at += step) {
            SCOPED_TRACE(at);
            flipBit(path, at);
            look();
            flipBit(path, at);
        }
    }

    const qint64 mStep = GetParam() == Engine::Sqlite ? kStep : 101;  // from one flip to the next [bytes]
    QTemporaryDir mFiles;
    WorkObserver mObserver;
    std::unique_ptr<Kxg::Catalogue> mCatalogue = openCatalogue();
    std::string mTold;
};

INSTANTIATE_TEST_SUITE_P(Engines, StudyProofTest, kBothEngines, engineName);

// ---- tag files

TEST_P(StudyProofTest, EveryByteOfATagFileCounts)
{
    fill();
    TagFile file;
    ASSERT_TRUE(file.readCacheFileForStudy("1.1", false));
    ASSERT_GT(file.statistics().blobs, 0);
    ASSERT_GT(file.statistics().volumes, 0);
    ASSERT_EQ(ofTagFile().tagFiles, 1);
    forEachFlip(tagFile(), mStep, [this] {
        ASSERT_EQ(ofTagFile().faults, 1);
        ASSERT_TRUE(isTold("is damaged")) << mTold;
    });
    EXPECT_EQ(ofTagFile().faults, 0) << mTold;
    // What a longer study left behind its end says nothing.
    QFile longer(tagFile());
    ASSERT_TRUE(longer.open(QIODevice::Append));
    longer.write("left over");
    longer.close();
    EXPECT_EQ(ofTagFile().faults, 0) << mTold;
}

TEST_P(StudyProofTest, ATagFileThatComesBackIsKnownAsOldAndHealed)
{
    fill();
    const QByteArray before = fileContent(tagFile());
    take({save(aSlice(4), "5")});
    const QByteArray last = fileContent(tagFile());
    ASSERT_NE(before, last);
    putFile(tagFile(), before);
    EXPECT_EQ(ofTagFile().faults, 1);
    EXPECT_TRUE(isTold("an earlier one of this archive; \"kdd build --all\" builds it anew")) << mTold;
    EXPECT_EQ(ofTagFile(true).healed, 1);
    EXPECT_TRUE(isTold("is built anew")) << mTold;
    EXPECT_EQ(ofTagFile().faults, 0);
    EXPECT_EQ(fileContent(tagFile()), last);
}

TEST_P(StudyProofTest, WhatSomethingElseWroteIsToldFromDamage)
{
    fill();
    TagFile file;
    ASSERT_TRUE(file.readCacheFileForStudy("1.1", true));
    const char* image = "1.1.7.3";
    ASSERT_EQ(file.removeImages(1, &image), 1);
    ASSERT_TRUE(file.writeCacheFile());
    EXPECT_EQ(ofTagFile().faults, 1);
    EXPECT_TRUE(isTold("something else wrote it")) << mTold;
    QFile::resize(tagFile(), 30);
    ofTagFile();
    EXPECT_TRUE(isTold("is damaged: it cannot be read")) << mTold;
    QFile::resize(tagFile(), 0);
    ofTagFile();
    EXPECT_TRUE(isTold("is damaged: it is empty")) << mTold;
    QFile::remove(tagFile());
    EXPECT_EQ(ofTagFile(true).healed, 1);
    EXPECT_TRUE(isTold("is not there")) << mTold;
    EXPECT_EQ(ofTagFile().faults, 0) << mTold;
}

TEST_P(StudyProofTest, AStudyThatWaitsAfterItsWriterDiedIsNoFault)
{
    fill();
    std::unique_ptr<Kxg::StudyClaim> claim;
    ASSERT_TRUE(mCatalogue->requestBuild({"1.1"}).good());
    ASSERT_TRUE(mCatalogue->claim("1.1", 0, claim).good());
    flipBit(tagFile(), 20, Clock::Now);  // and it dies before the database knows
    claim.reset();
    EXPECT_EQ(ofTagFile(true).faults, 0) << mTold;
    StudyBuilders(mObserver, 1).buildWaiting(1);
    EXPECT_EQ(ofTagFile().tagFiles, 1);
    EXPECT_EQ(mTold, "");
}

TEST_P(StudyProofTest, WhatIsBeingWrittenIsNoFault)
{
    const Setting digests("KDD_FILE_DIGESTS", "1");
    fill();
    std::atomic<bool> isDone{false};
    std::thread others([&] {
        for (int i = 0; i < 40; ++i)
            StudyBuilders(mObserver, 1, i % 2 == 0).build({"1.1"});
        isDone = true;
    });
    int looks = 0;
    int faults = 0;
    std::string told;
    for (; !isDone || looks == 0; ++looks) {
        faults += ofTagFile().faults;
        told += mTold;
        faults += ofFiles().faults;
        told += mTold;
    }
    others.join();
    EXPECT_EQ(faults, 0) << looks << '\n' << told;
}

// ---- DICOM and volume files

TEST_P(StudyProofTest, EveryByteOfADicomFileCountsOnceItHasADigest)
{
    fill();
    EXPECT_EQ(ofFiles().undigested, 3);
    EXPECT_EQ(ofFiles(true).recorded, 4);
    EXPECT_EQ(ofFiles().undigested, 0);
    const QString path = mFiles.filePath(QStringLiteral("2"));
    forEachFlip(path, mStep, [this] {
        ASSERT_EQ(ofFiles().faults, 1);
        ASSERT_TRUE(isTold("/2 is damaged: its bytes have changed")) << mTold;
    });
    EXPECT_EQ(ofFiles().faults, 0) << mTold;
    flipBit(path, QFile(path).size() - 2, Clock::Now);
    EXPECT_EQ(ofFiles(true).faults, 1);
    EXPECT_TRUE(isTold("was changed since it was registered")) << mTold;
    take({path});
    EXPECT_EQ(ofFiles().undigested, 1) << "the digest was of other bytes";
    EXPECT_EQ(ofFiles().faults, 0) << mTold;
    QFile::remove(path);
    EXPECT_EQ(ofFiles().faults, 1);
    EXPECT_TRUE(isTold("is not there")) << mTold;
}

TEST_P(StudyProofTest, AFlipInAVolumeFileIsNoticedOrHarmless)
{
    fill();
    const QByteArray path = volume();
    const QByteArray shown = shownOf(path);
    ASSERT_FALSE(shown.isEmpty());
    int noticed = 0;
    forEachFlip(QString::fromUtf8(path), mStep, [&] {
        const int faults = ofFiles().faults;
        noticed += faults;
        ASSERT_TRUE(faults == 1 || shownOf(path) == shown);
    });
    EXPECT_GT(noticed, 0);
    // By its digest every byte counts.
    EXPECT_EQ(ofFiles(true).recorded, 4);
    forEachFlip(QString::fromUtf8(path), 41, [this] { ASSERT_EQ(ofFiles().faults, 1); });
}

// ---- in the background

constexpr BackgroundCheck::Pace kSwift = {qint64(1) << 30,
                                          std::chrono::hours(1),
                                          true,
                                          true,
                                          std::chrono::milliseconds(5),
                                          std::chrono::milliseconds(0),
                                          std::chrono::milliseconds(5)};

TEST_P(StudyProofTest, TheBackgroundFindsAndHealsAndGoesOnWhereItWas)
{
    fill();
    ofFiles(true);
    ofFiles(true, "1.2");
    flipBit(tagFile(), QFile(tagFile()).size() - 5);
    const QString rotten = mFiles.filePath(QStringLiteral("4"));
    flipBit(rotten, QFile(rotten).size() - 2);
    {
        BackgroundCheck first(kSwift);
        BackgroundCheck second(kSwift);
        first.start();
        second.start();
        ASSERT_TRUE(comesTrue([&] { return first.counts().studies + second.counts().studies == 2; }));
        const auto one = first.counts();
        const auto other = second.counts();
        EXPECT_TRUE(one.studies == 0 || other.studies == 0) << "one is at work";
        EXPECT_EQ(one.faults + other.faults, 2);
        EXPECT_EQ(one.healed + other.healed, 1);
        ASSERT_TRUE(comesTrue([&] { return first.counts().faulty == 1 && second.counts().faulty == 1; }));
    }
    EXPECT_EQ(mLog.count("The tag file of study 1.1 is built anew"), 1);
    EXPECT_EQ(mLog.count("/4 is damaged"), 1);
    EXPECT_EQ(ofTagFile().faults, 0) << mTold;
    // Both were looked at within the hour.
    BackgroundCheck later(kSwift);
    later.start();
    ASSERT_TRUE(comesTrue([&] { return later.counts().faulty == 1 || later.counts().studies > 0; }));
    Kxg::CheckedStudy next;
    ASSERT_TRUE(mCatalogue->nextToCheck(1, next).good());
    EXPECT_EQ(next.studyInstanceUID, "");
    EXPECT_EQ(later.counts().studies, 0);
}

TEST_P(StudyProofTest, TheBackgroundEndsInTheMiddleAndLaterGoesOn)
{
    fill();
    BackgroundCheck::Pace slow = kSwift;
    slow.bytesPerSecond = 1;
    {
        BackgroundCheck check(slow);
        check.start();
        ASSERT_TRUE(comesTrue([&] { return check.counts().bytes > 0; }));
    }
    Kxg::CheckedStudy next;
    ASSERT_TRUE(mCatalogue->nextToCheck(1, next).good());
    EXPECT_EQ(next.studyInstanceUID, "1.1");
    // As one left it that ended after the second file.
    next.position = mFiles.filePath(QStringLiteral("2")).toUtf8();
    next.faults = 1;
    ASSERT_TRUE(mCatalogue->noteCheck(next, false).good());
    flipBit(tagFile(), 20);
    BackgroundCheck check(kSwift);
    check.start();
    ASSERT_TRUE(comesTrue([&] { return check.counts().studies == 2; }));
    EXPECT_EQ(check.counts().faults, 0) << "the tag file was looked at before";
    ASSERT_TRUE(comesTrue([&] { return check.counts().faulty == 1; })) << "the fault of before counts";
}

}  // namespace
