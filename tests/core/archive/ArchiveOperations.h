#pragma once

#include "core/archive/ArchiveModel.h"
#include "kddlib/archive/ArchiveDatabase.h"
#include "kddlib/archive/FileScan.h"
#include "kddlib/archive/Registration.h"
#include "kddlib/archive/StudyBuilders.h"
#include "kddlib/archive/StudyChange.h"
#include "kddlib/archive/StudyCheck.h"
#include "kddlib/archive/StudyIntake.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagfile/qa/QAData.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/database/Kxg.h"
#include "support/DatasetBuilder.h"
#include "support/FileContent.h"
#include "support/LogCapture.h"
#include "support/TemporaryStore.h"

#include <QDir>
#include <QFile>

#include <fcntl.h>
#include <sys/stat.h>

#include <random>

namespace Kdd
{

constexpr const char* kStudies[] = {"1.1", "1.2", "1.3"};

/// The operations of an archive, each done there and in its model. What was done is told in words.
class ArchiveOperations
{
public:
    ArchiveOperations(const QByteArray& address, unsigned seed)
        : mRandom(seed)
    {
        Kxg::SetDatabaseServer(address.isEmpty() ? "sqlite:" + mStore.filePath("catalogue.db").toUtf8()
                                                 : address);
        mCatalogue = openCatalogue();
        QDir().mkpath(mStore.filePath("files/a"));
        QDir().mkpath(mStore.filePath("files/b"));
    }
    ~ArchiveOperations() { Kxg::SetDatabaseServer(QByteArray()); }

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
        tellFile("write ", path, file);
        save(path, file);
        setClock(path);
        mModel.write(path, file);
    }

    /// Of two contents in the same tick of the clock and of the same length nobody can tell.
    void rewrite(const std::string& path)
    {
        const auto present = mModel.disk().find(path);
        struct stat before = {};
        if (present == mModel.disk().end() || ::stat(path.c_str(), &before) != 0)
            return;
        ModelFile file = present->second;
        file.patient = "Poe^" + std::to_string(pick(4));
        if (file.patient.size() != present->second.patient.size())
            return;
        tellFile("unnoticed, write ", path, file);
        save(path, file);
        const timespec times[] = {before.st_mtim, before.st_mtim};
        ::utimensat(AT_FDCWD, path.c_str(), times, 0);
        mModel.rewrite(path, file);
    }

    void touch(const std::string& path)
    {
        if (mModel.disk().count(path) == 0)
            return;
        tell("set the clock of " + path);
        setClock(path);
        mModel.touch(path);
    }

    void tellFile(const char* what, const std::string& path, const ModelFile& file)
    {
        tell(what + path + ": study " + file.study + ", series " + file.series + ", image " + file.sop +
             ", patient " + file.patient + ", number " + file.number);
    }

    void save(const std::string& path, const ModelFile& file)
    {
        DatasetBuilder image = anImage(file.sop.c_str());
        image.inStudy(file.study.c_str()).inSeries(file.series.c_str());
        image.with(DCM_PatientName, file.patient.c_str()).with(DCM_InstanceNumber, file.number.c_str());
        image.with(DCM_Modality, "OT").with(DCM_StudyDate, "20240131");
        if (file.sop.empty())
            image.without(DCM_SOPInstanceUID);
        image.save(QString::fromStdString(path));
    }

    /// To and fro, for nothing may depend on later files being younger.
    void setClock(const std::string& path)
    {
        const timespec time = {1600000000 + (++mTick % 2 == 0 ? mTick : -mTick), 0};
        const timespec times[] = {time, time};
        ::utimensat(AT_FDCWD, path.c_str(), times, 0);
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
        Result result = files.run(paths, [&](DicomInput input) { return intake.take(std::move(input)); });
        if (result.good())
            result = intake.finish();
        if (result.good() && files.unchanged() > 0)
            result = intake.completeWaiting(paths);
        expect(result.good() && files.refused().empty(), "the intake broke off");
        expectSame(intake.refused().empty(), mModel.add(folder), "add");
    }

    void index(const std::string& folder)
    {
        tell("index " + folder);
        Registration registration(*mCatalogue);
        FileScan files(*mCatalogue, mObserver);
        Result result = files.run({QByteArray::fromStdString(folder)},
                                  [&](const DicomInput& input) { return registration.add(input); });
        if (result.good())
            result = registration.flush();
        expect(result.good() && files.refused().empty(), "the registration broke off");
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
        expect(requestStale(*mCatalogue, again).good(), "nothing could be requested");
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
        const std::string image = what > 1 ? "9." + std::to_string(pick(10)) : "";
        const std::string series = what == 1 ? study + '.' + std::to_string(pick(2)) : "";
        tell("delete study " + study + " series " + series + " image " + image);
        const ArchiveNode node = {QByteArray::fromStdString(study), QByteArray::fromStdString(series),
                                  QByteArray::fromStdString(image)};
        expectSame(StudyChange(*mCatalogue).remove(node).good(), mModel.remove(study, series, image),
                   "delete");
    }

    void sync(const std::string& study)
    {
        tell("sync " + study);
        TagFile file;
        expectSame(StudyChange(*mCatalogue).synchronise(QByteArray::fromStdString(study), file).good(),
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
        const Result corrected = StudyChange::correct(job);
        expect(corrected.good(), "the correction is refused: " + corrected.text().toStdString());
        const int found = mModel.edit(study, image, patient);
        expect(job.outcome.notFound.size() == 1 - found, "the correction finds another number of images");
    }

    // ---- tag files that others change

    struct OldCopy
    {
        QByteArray bytes;
        ModelStudy content;
    };

    QByteArray bytesOf(const std::string& study) const { return fileContent(tagFilePath(study)); }

    void spoil(const std::string& study)
    {
        const ModelStudy* present = mModel.tagFile(study);
        switch (pick(6)) {
        case 0:
        case 1:
            if (present == nullptr)
                return;
            tell("keep a copy of the tag file of " + study);
            mCopies[study] = {bytesOf(study), *present};
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
            putFile(tagFilePath(study), bytesOf(other));
            mModel.spoil(study, nullptr, true);
            break;
        }
        default:
            if (present == nullptr)
                return;
            tell("cut the tag file of " + study);
            putFile(tagFilePath(study), bytesOf(study).left(static_cast<int>(pick(60))));
            mModel.spoil(study, nullptr, true);
        }
    }

    void restore(const std::string& study)
    {
        tell("restore the old tag file of " + study);
        putFile(tagFilePath(study), mCopies[study].bytes);
        mModel.spoil(study, &mCopies[study].content, true);
        // What lies behind the bytes that count is left over, and may be another time.
        Kxg::StudyContents contents;
        EXPECT_TRUE(mCatalogue->studyContents(QByteArray::fromStdString(study), contents).good());
        const int counts = static_cast<int>(contents.tagFile.size);
        if (mWritten.count(study) > 0 && mWritten[study].left(counts) == mCopies[study].bytes.left(counts))
            mModel.recognise(study);
    }

    /// By which the archive recognises its tag files from now on.
    void noteWritten()
    {
        for (const char* study : kStudies) {
            if (mModel.listed().count(study) == 0)
                mWritten.erase(study);
            else if (mModel.isTrusted(study))
                mWritten[study] = bytesOf(study);
        }
    }

    LogCapture mLog;
    TemporaryStore mStore;
    std::unique_ptr<Kxg::Catalogue> mCatalogue;
    WorkObserver mObserver;
    ArchiveModel mModel;
    std::mt19937 mRandom;
    int mTick = 0;
    std::map<std::string, OldCopy> mCopies;
    std::map<std::string, QByteArray> mWritten;  // tag files, by the archive
    std::string mStory;
    std::string mFault;
};

}  // namespace Kdd
