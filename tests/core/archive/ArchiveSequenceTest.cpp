#include "core/archive/ArchiveModel.h"
#include "kddlib/archive/ArchiveDatabase.h"
#include "kddlib/archive/FileScan.h"
#include "kddlib/archive/Registration.h"
#include "kddlib/archive/StudyBuilders.h"
#include "kddlib/archive/StudyChange.h"
#include "kddlib/archive/StudyCheck.h"
#include "kddlib/archive/StudyIntake.h"
#include "kddlib/tagfile/QAData.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/database/Kxg.h"
#include "support/DatasetBuilder.h"
#include "support/LogCapture.h"
#include "support/PostgresServer.h"
#include "support/TemporaryStore.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cstdlib>
#include <random>

using namespace Kdd;

namespace
{

const char* const kStudies[] = {"1.1", "1.2", "1.3"};

/// Random operations on an archive and on its model, compared after each. What was done is told in words.
class Sequence
{
public:
    Sequence(const QByteArray& address, unsigned seed)
        : mRandom(seed)
    {
        Kxg::SetDatabaseServer(address.isEmpty() ? "sqlite:" + mStore.filePath("catalogue.db").toUtf8()
                                                 : address);
        mCatalogue = openCatalogue();
        QDir().mkpath(mStore.filePath("files/a"));
        QDir().mkpath(mStore.filePath("files/b"));
    }
    ~Sequence() { Kxg::SetDatabaseServer(QByteArray()); }

    /// Until the first difference.
    void run(int steps)
    {
        for (int i = 0; i < steps && mFault.empty(); ++i) {
            step();
            compare();
        }
        if (mFault.empty())
            compareWithFreshBuild();
    }

    const std::string& fault() const { return mFault; }
    const std::string& story() const { return mStory; }

protected:
    unsigned pick(unsigned count) { return static_cast<unsigned>(mRandom() % count); }
    std::string pickStudy() { return kStudies[pick(3)]; }
    void tell(const std::string& what) { mStory += what + '\n'; }
    void expect(bool isFine, const std::string& what)
    {
        if (isFine || !mFault.empty())
            return;
        mFault = what;
        const auto& lines = mLog.lines();
        for (std::size_t i = lines.size() - std::min<std::size_t>(lines.size(), 5); i < lines.size(); ++i)
            mFault += "\nlog: " + lines[i];
    }
    void expectSame(bool got, bool wanted, const std::string& what)
    {
        expect(got == wanted, what + (got ? " succeeded" : " failed"));
    }

    std::string root() const { return mStore.filePath("files").toStdString(); }
    std::string pickFolder() { return root() + (pick(3) == 0 ? "/a" : pick(2) == 0 ? "/b" : ""); }
    std::string pickPath()
    {
        return root() + (pick(2) == 0 ? "/a/" : "/b/") + std::to_string(pick(7)) + ".dcm";
    }
    static QString tagFilePath(const std::string& study)
    {
        return TagFile::cacheFilePathForStudy(study.c_str());
    }

    void step()
    {
        const unsigned what = pick(100);
        if (what < 28)
            write(pickPath());
        else if (what < 33)
            removeFile(pickPath());
        else if (what < 49)
            add(pickFolder());
        else if (what < 56)
            index(pickFolder());
        else if (what < 61)
            buildWaiting();
        else if (what < 67)
            buildAll(false);
        else if (what < 71)
            buildAll(true);
        else if (what < 75)
            settle();
        else if (what < 85)
            remove();
        else if (what < 89)
            sync(pickStudy());
        else if (what < 92)
            edit(pickStudy(), "9." + std::to_string(pick(10)), "Roe^" + std::to_string(pick(3)));
        else
            spoil(pickStudy());
    }

    // ---- files

    void write(const std::string& path)
    {
        // Often another version of what is there, else anything.
        const auto present = mModel.disk().find(path);
        ModelFile file;
        if (present != mModel.disk().end() && pick(2) == 0)
            file = present->second;
        else
            file = {pickStudy(), "", pick(12) == 0 ? "" : "9." + std::to_string(pick(10)), "", ""};
        if (file.series.empty() || pick(6) == 0)
            file.series = file.study + '.' + std::to_string(pick(2));
        file.patient = "Doe^" + std::to_string(pick(4));
        file.number = std::to_string(pick(50));
        put(path, file);
    }

    void put(const std::string& path, const ModelFile& file)
    {
        tell("write " + path + ": study " + file.study + ", series " + file.series + ", image " + file.sop +
             ", patient " + file.patient + ", number " + file.number);
        DatasetBuilder image = anImage(file.sop.c_str());
        image.inStudy(file.study.c_str()).inSeries(file.series.c_str());
        image.with(DCM_PatientName, file.patient.c_str()).with(DCM_InstanceNumber, file.number.c_str());
        image.with(DCM_Modality, "OT").with(DCM_StudyDate, "20240131");
        if (file.sop.empty())
            image.without(DCM_SOPInstanceUID);
        DcmFileFormat format(&image.dataset());
        expect(format.saveFile(path.c_str(), EXS_LittleEndianExplicit).good(), "a file could not be written");
        // Of two contents in the same tick of the clock and of the same length nobody could tell.
        const timespec times[] = {{1600000000 + ++mTick, 0}, {1600000000 + mTick, 0}};
        ::utimensat(AT_FDCWD, path.c_str(), times, 0);
        mModel.write(path, file);
    }

    void removeFile(const std::string& path)
    {
        tell("remove the file " + path);
        QFile::remove(QString::fromStdString(path));
        mModel.removeFromDisk(path);
    }

    // ---- operations

    void add(const std::string& folder)
    {
        tell("add " + folder);
        const QList<QByteArray> paths = {QByteArray::fromStdString(folder)};
        FileScan files(*mCatalogue, mObserver);
        StudyIntake intake(*mCatalogue, mObserver);
        const bool isDone =
            files.run(paths, [&](DicomInput input) { return intake.take(std::move(input)); }) &&
            intake.finish() && (files.unchanged() == 0 || intake.completeWaiting(paths));
        expect(isDone && files.refused().empty(), "the intake broke off");
        expectSame(intake.refused().empty(), mModel.add(folder), "add");
    }

    void index(const std::string& folder)
    {
        tell("index " + folder);
        Registration registration(*mCatalogue);
        FileScan files(*mCatalogue, mObserver);
        const bool isDone = files.run({QByteArray::fromStdString(folder)}, [&](const DicomInput& input) {
            return registration.add(input);
        }) && registration.flush();
        expect(isDone && files.refused().empty(), "the registration broke off");
        mModel.index(folder);
    }

    bool buildQueue() { return StudyBuilders(mObserver, 1).buildWaiting(0).failed == 0; }

    void buildWaiting()
    {
        tell("build");
        expectSame(buildQueue(), mModel.buildWaiting(), "build");
    }

    void buildAll(bool again)
    {
        tell(again ? "build --all --again" : "build --all");
        std::map<std::string, QByteArray> settled;
        for (const char* study : kStudies) {
            if (mModel.isSettled(study))
                settled[study] = bytesOf(study);
        }
        expect(requestStale(*mCatalogue, again), "nothing could be requested");
        expectSame(buildQueue(), mModel.buildAll(again), "build --all");
        for (const auto& study : settled)
            expect(bytesOf(study.first) == study.second,
                   "settled study " + study.first + " is built otherwise");
    }

    void settle()
    {
        tell("settle");
        expect(mCatalogue->settleNow().good(), "nothing could be settled");
        expectSame(buildQueue(), mModel.settle(), "settle");
    }

    void remove()
    {
        const std::string study = pickStudy();
        const unsigned what = pick(5);
        const std::string series = what == 1 ? study + '.' + std::to_string(pick(2)) : "";
        const std::string image = what > 1 ? "9." + std::to_string(pick(10)) : "";
        remove(study, series, image);
    }

    void remove(const std::string& study, const std::string& series, const std::string& image)
    {
        tell("delete study " + study + " series " + series + " image " + image);
        const ArchiveNode node = {QByteArray::fromStdString(study), QByteArray::fromStdString(series),
                                  QByteArray::fromStdString(image)};
        expectSame(StudyChange(*mCatalogue).remove(node), mModel.remove(study, series, image), "delete");
    }

    void sync(const std::string& study)
    {
        tell("sync " + study);
        TagFile file;
        expectSame(StudyChange(*mCatalogue).synchronise(QByteArray::fromStdString(study), file),
                   mModel.sync(study), "sync");
    }

    /// Of a tag file that shows what the catalogue believes; else corrections may be refused.
    void edit(const std::string& study, const std::string& image, const std::string& patient)
    {
        if (!mModel.isTrusted(study) || mModel.listedImages(study).count(image) == 0)
            return;
        tell("qa study " + study + " image " + image + ": patient " + patient);
        QAData job;
        job.studyUID = QByteArray::fromStdString(study);
        job.images = {QByteArray::fromStdString(image)};
        job.substitutions = {{DCM_PatientName, QString::fromStdString(patient)}};
        job.timestamp = "20240131120000";
        job.login = "anna";
        QString message;
        expect(StudyChange::correct(job, message), "the correction is refused: " + message.toStdString());
        const int found = mModel.edit(study, image, patient);
        expect(job.outcome.notFound.size() == 1 - found, "the correction finds another number of images");
    }

    // ---- tag files that others change

    struct OldCopy
    {
        QByteArray bytes;
        ModelStudy content;
    };

    QByteArray bytesOf(const std::string& study) const
    {
        QFile file(tagFilePath(study));
        return file.open(QIODevice::ReadOnly) ? file.readAll() : QByteArray();
    }

    void spoil(const std::string& study)
    {
        const ModelStudy* present = mModel.tagFile(study);
        switch (pick(6)) {
        case 0:
        case 1:
            if (present != nullptr)
                keepCopy(study);
            break;
        case 2:
            if (mCopies.count(study) > 0 && mCopies[study].bytes != bytesOf(study))
                restore(study);
            break;
        case 3:
            tell("remove the tag file of " + study);
            if (QFile::remove(tagFilePath(study)))
                mModel.spoil(study, nullptr, false);
            break;
        case 4: {
            const std::string other = pickStudy();
            if (other == study || mModel.tagFile(other) == nullptr)
                return;
            tell("put the tag file of " + other + " in the place of " + study);
            replace(study, bytesOf(other));
            mModel.spoil(study, nullptr, true);
            break;
        }
        default:
            if (present == nullptr)
                return;
            cut(study, static_cast<int>(pick(60)));
        }
    }

    void keepCopy(const std::string& study) { mCopies[study] = {bytesOf(study), *mModel.tagFile(study)}; }

    void restore(const std::string& study)
    {
        tell("restore the old tag file of " + study);
        replace(study, mCopies[study].bytes);
        mModel.spoil(study, &mCopies[study].content, true);
    }

    void cut(const std::string& study, int length)
    {
        tell("cut the tag file of " + study);
        replace(study, bytesOf(study).left(length));
        mModel.spoil(study, nullptr, true);
    }

    void replace(const std::string& study, const QByteArray& bytes)
    {
        QDir().mkpath(QFileInfo(tagFilePath(study)).path());
        QFile file(tagFilePath(study));
        expect(file.open(QIODevice::WriteOnly) && file.write(bytes) == bytes.size(),
               "no tag file could be put");
    }

    // ---- comparison

    static std::string keyed(const ModelStudy& study)
    {
        std::string text;
        for (const auto& image : study)
            text += "  " + image.first + " from " + image.second.path + ": " + image.second.shows.study +
                    ' ' + image.second.shows.series + ' ' + image.second.shows.patient + ' ' +
                    image.second.shows.number + '\n';
        return text;
    }

    static ModelStudy contentOf(const TagFile& file)
    {
        ModelStudy study;
        for (auto it = file.imagesByUID().cbegin(); it != file.imagesByUID().cend(); ++it) {
            const TagMap& image = *it.value();
            QByteArray patient;
            QByteArray number;
            image.findAndGetString(DCM_PatientName, patient);
            image.findAndGetString(DCM_InstanceNumber, number);
            study[it.key().toStdString()] = {
                filePathOf(image).toStdString(),
                {image.uid(TagMap::StudyLevel).toStdString(), image.uid(TagMap::SeriesLevel).toStdString(),
                 image.uid(TagMap::ImageLevel).toStdString(), patient.toStdString(), number.toStdString()}};
        }
        return study;
    }

    void compare()
    {
        for (const char* study : kStudies) {
            compareTagFile(study);
            compareListing(study);
        }
        compareList();
        compareCheck();
    }

    void compareTagFile(const std::string& study)
    {
        TagFile file;
        const bool isRead = file.readCacheFileForStudy(study.c_str(), false);
        const ModelStudy* wanted = mModel.tagFile(study);
        expect(isRead == (wanted != nullptr), "study " + study + (isRead ? " has" : " has no") + " tag file");
        const std::string got = keyed(contentOf(file));
        const std::string expected = wanted != nullptr ? keyed(*wanted) : "";
        expect(got == expected, "study " + study + " shows\n" + got + "instead of\n" + expected);
        expect(QFile::exists(tagFilePath(study)) == mModel.hasTagFile(study),
               "a tag file too many or too few");
    }

    void compareListing(const std::string& study)
    {
        Kxg::StudyContents contents;
        expect(mCatalogue->studyContents(QByteArray::fromStdString(study), contents).good(), "no contents");
        ModelStudy got;
        for (const Kxg::ListedImage& image : contents.images) {
            const QByteArray& key = image.sopInstanceUID.isEmpty() ? image.path : image.sopInstanceUID;
            got[key.toStdString()] = {image.path.toStdString(),
                                      {study, image.seriesInstanceUID.toStdString(), "", "", ""}};
        }
        ModelStudy wanted = mModel.listedImages(study);
        for (auto& image : wanted)
            image.second.shows = {study, image.second.shows.series, "", "", ""};
        expect(keyed(got) == keyed(wanted),
               "of study " + study + " is listed\n" + keyed(got) + "instead of\n" + keyed(wanted));
        expect(contents.isWaiting == mModel.isWaiting(study),
               "study " + study + (contents.isWaiting ? " waits" : " does not wait"));
    }

    void compareList()
    {
        std::vector<Kxg::StudySummary> list;
        expect(mCatalogue->listStudies(list).good(), "no list");
        std::set<std::string> names;
        for (const Kxg::StudySummary& each : list) {
            const std::string study = each.studyInstanceUID.toStdString();
            names.insert(study);
            expect(each.images == static_cast<int>(mModel.listedImages(study).size()),
                   "study " + study + " is said to have " + std::to_string(each.images) + " images");
            const ModelStudy* file = mModel.tagFile(study);
            if (mModel.isFaulty(study) || file == nullptr)
                continue;
            const bool isNamed = std::any_of(file->begin(), file->end(), [&](const auto& image) {
                return image.second.shows.patient == each.patientName.toStdString();
            });
            expect(isNamed, "study " + study + " is listed as of " + each.patientName.toStdString());
        }
        expect(names == mModel.listed(), "other studies are listed");
    }

    void compareCheck()
    {
        std::string told;
        StudyCheck check(*mCatalogue, mObserver,
                         [&](const QString& fault) { told += fault.toStdString() + '\n'; });
        check.checkAll();
        expect(told.empty() != mModel.isFaulty(),
               told.empty() ? "the check finds nothing" : "the check finds\n" + told);
    }

    /// What only grew must be what a build into an empty folder makes.
    void compareWithFreshBuild()
    {
        add(root());
        settle();
        buildAll(false);
        compare();
        std::map<std::string, Kxg::TagFileStamp> stamps = stampsOfSettled();
        QTemporaryDir fresh;
        TagFile::setMetaFolder(fresh.path().toLocal8Bit().constData());
        tell("build all into an empty folder");
        requestStale(*mCatalogue, true);
        buildQueue();
        for (const auto& stamp : stampsOfSettled())
            expect(stamps[stamp.first] == stamp.second,
                   "study " + stamp.first + " is not what a build makes of it");
    }

    std::map<std::string, Kxg::TagFileStamp> stampsOfSettled()
    {
        std::map<std::string, Kxg::TagFileStamp> stamps;
        for (const char* study : kStudies) {
            Kxg::StudyContents contents;
            if (mModel.isSettled(study) && mCatalogue->studyContents(study, contents).good())
                stamps[study] = contents.tagFile;
        }
        return stamps;
    }

    LogCapture mLog;
    TemporaryStore mStore;
    std::unique_ptr<Kxg::Catalogue> mCatalogue;
    WorkObserver mObserver;
    ArchiveModel mModel;
    std::mt19937 mRandom;
    int mTick = 0;
    std::map<std::string, OldCopy> mCopies;
    std::string mStory;
    std::string mFault;
};

/// What random sequences found, in its shortest form.
class FixedSequence : public testing::Test, protected Sequence
{
protected:
    FixedSequence()
        : Sequence(QByteArray(), 1)
    {
        at("1", image("9.1"));
        at("2", image("9.2"));
        add(root());
    }

    static ModelFile image(const char* sop, const char* patient = "Doe^1")
    {
        return {"1.1", "1.1.0", sop, patient, "1"};
    }
    void at(const char* name, const ModelFile& file) { put(root() + "/a/" + name, file); }

    void expectAgreement()
    {
        compare();
        EXPECT_EQ(fault(), "") << story();
    }

    void expectHealed()
    {
        buildAll(false);
        expectAgreement();
        EXPECT_FALSE(mModel.isFaulty());
    }
};

TEST_F(FixedSequence, AddingBuildsInWhatWasOnlyIndexed)
{
    at("1", image("9.1", "Roe^R"));
    index(root());
    at("3", image("9.3"));
    add(root() + "/a");
    expectAgreement();
    EXPECT_FALSE(mModel.isFaulty());
}

TEST_F(FixedSequence, DeletingBuildsInWhatWasOnlyIndexed)
{
    at("1", image("9.1", "Roe^R"));
    index(root());
    remove("1.1", "", "9.2");
    expectAgreement();
    EXPECT_FALSE(mModel.isFaulty());
}

TEST_F(FixedSequence, AnEditLeavesAnImageInTheSeriesOfItsFile)
{
    at("1", {"1.1", "1.1.7", "9.1", "Doe^1", "1"});
    index(root());
    edit("1.1", "9.1", "Roe^R");
    expectAgreement();
    expectHealed();
    at("1", {"1.1", "1.1.8", "9.1", "Doe^1", "1"});
    add(root());
    expectHealed();
}

TEST_F(FixedSequence, ASyncedOldTagFileWaitsToBeBuilt)
{
    keepCopy("1.1");
    at("1", image("9.1", "Roe^R"));
    add(root());
    restore("1.1");
    sync("1.1");
    expectAgreement();
    expectHealed();
}

TEST_F(FixedSequence, AnEmptyTagFileIsBuilt)
{
    cut("1.1", 0);
    expectHealed();
}

TEST_F(FixedSequence, AFileThatIsAnotherImageNowIsKeptUntilItIsTaken)
{
    at("1", {"1.2", "1.2.0", "9.7", "Roe^R", "1"});
    buildAll(true);
    expectAgreement();
    add(root());
    expectHealed();
}

TEST_F(FixedSequence, WhatCannotBeReadStaysAndWaits)
{
    removeFile(root() + "/a/1");
    buildAll(true);
    expectAgreement();
    at("1", image("9.1"));
    add(root());
    expectHealed();
}

/// More on request: KDD_ARCHIVE_STEPS steps in all, from seed KDD_ARCHIVE_SEED.
unsigned setting(const char* name, unsigned standard)
{
    const char* text = std::getenv(name);
    return text != nullptr ? static_cast<unsigned>(std::strtoul(text, nullptr, 10)) : standard;
}

constexpr unsigned kStepsOfSequence = 40;

void expectAgreement(const QByteArray& address, unsigned seed)
{
    Sequence sequence(address, seed);
    sequence.run(kStepsOfSequence);
    EXPECT_EQ(sequence.fault(), "") << "seed " << seed << ", after\n" << sequence.story();
}

TEST(ArchiveSequence, AgreesWithTheModelOnSqlite)
{
    const unsigned first = setting("KDD_ARCHIVE_SEED", 1);
    const unsigned count = setting("KDD_ARCHIVE_STEPS", 1600) / kStepsOfSequence;
    for (unsigned seed = first; seed < first + count && !HasFailure(); ++seed)
        expectAgreement(QByteArray(), seed);
}

TEST(ArchiveSequence, AgreesWithTheModelOnPostgres)
{
    const unsigned first = setting("KDD_ARCHIVE_SEED", 1) + 100000;
    const unsigned count = setting("KDD_ARCHIVE_STEPS", 1600) / kStepsOfSequence / 10;
    for (unsigned seed = first; seed < first + count && !HasFailure(); ++seed)
        expectAgreement(newPostgresDatabase(), seed);
}

}  // namespace
