#pragma once

#include "kddlib/TagFileGenerator.h"
#include "kddlib/tagfile/StudyRecord.h"
#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagfile/qa/QAData.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/database/Catalogue.h"
#include "platform/database/Kxg.h"
#include "platform/volumefile/OrlanMeshWriter.h"
#include "platform/volumefile/SOPInstanceUtility.h"
#include "support/DatasetBuilder.h"
#include "support/FileContent.h"
#include "support/TemporaryStore.h"
#include "support/TreeText.h"

#include <QFile>

#include <gtest/gtest.h>

#include <map>
#include <regex>

namespace Kdd
{

constexpr int kSize = 32;  // of every picture and slice [pixels]

/// DICOM files, a database that lists them and the tag files that are built from both.
class ArchiveTest : public testing::Test
{
protected:
    using Uids = QList<QByteArray>;
    using Substitutions = QVector<QASubstitution>;

    /// With an embedded database unless there is one already.
    explicit ArchiveTest(const QByteArray& address = QByteArray())
    {
        if (!address.isEmpty())
            mAddress = address;
        Kxg::SetDatabaseServer(mAddress);
        Result result;
        mCatalogue = Kxg::Catalogue::open(mAddress, result);
        EXPECT_TRUE(result.good()) << qPrintable(result.text());
    }
    ~ArchiveTest() override { Kxg::SetDatabaseServer(QByteArray()); }

    QByteArray path(const QByteArray& name) const { return mStore.folder().toLocal8Bit() + '/' + name; }

    /// An image of series STUDY.1 unless said otherwise.
    static DatasetBuilder image(const char* uid, const char* study)
    {
        const QByteArray series = QByteArray(study) + ".1";
        return anImage(uid)
            .inStudy(study)
            .inSeries(series)
            .with(DCM_PatientName, "Doe^J")
            .with(DCM_InstanceNumber, "1");
    }

    /// One that takes 3 MB of a tag file that is not compressed.
    static DatasetBuilder largeImage(const char* uid, const char* study)
    {
        return image(uid, study).data(DcmTag(0x6000, 0x3000, EVR_OB), QByteArray(3'000'000, '\x5a'));
    }

    void save(const DatasetBuilder& image, const QByteArray& name)
    {
        image.save(QFile::decodeName(path(name)));
        const std::unique_ptr<TagMap> map(image.map());
        registerFiles({{fileRecord(*map, path(name), {})}, {}, {}});
    }

    void save(const char* uid, const char* study) { save(image(uid, study), uid); }

    void registerFiles(const Kxg::FileRecords& files)
    {
        QMap<QByteArray, qint64> requests;
        const Result result = mCatalogue->registerFiles(files, requests);
        ASSERT_TRUE(result.good()) << qPrintable(result.text());
    }

    /// What the database has of the corrections of an image.
    void damageRecord(const char* study, const char* uid)
    {
        QMap<QByteArray, qint64> requests;
        ASSERT_TRUE(mCatalogue->recordCorrections({{study, uid, study, "", uid, "?"}}, requests).good());
    }

    /// As a worker does it.
    void build(const QByteArray& study)
    {
        std::unique_ptr<Kxg::StudyClaim> claim;
        ASSERT_TRUE(mCatalogue->claim(study, 0, claim).good() && claim != nullptr);
        Kxg::StudyContents contents;
        ASSERT_TRUE(mCatalogue->studyContents(study, contents).good());
        if (contents.images.empty() && contents.volumes.isEmpty()) {
            QFile::remove(TagFile::cacheFilePathForStudy(study));
            EXPECT_TRUE(claim->finishRemoved().good());
            return;
        }
        TagFile file;
        mGenerator = {};
        EXPECT_TRUE(mGenerator.createTagFile(file, claim->studyId(), study.constData()));
        EXPECT_TRUE(claim->finish(builtStudy(file)).good());
    }

    /// All studies that there are in the database.
    Uids studies()
    {
        std::vector<Kxg::StudySummary> list;
        EXPECT_TRUE(mCatalogue->listStudies(list).good());
        Uids uids;
        for (const Kxg::StudySummary& study : list)
            uids.append(study.studyInstanceUID);
        return uids;
    }

    void buildAll()
    {
        for (const QByteArray& study : studies())
            build(study);
    }

    int waiting()
    {
        int count = -1;
        EXPECT_TRUE(mCatalogue->countWaiting(count).good());
        return count;
    }

    static QByteArray halfBright()
    {
        QByteArray pixels(kSize * kSize, '\0');
        for (int i = 0; i < pixels.size(); ++i)
            pixels[i] = i % kSize < kSize / 2 ? '\x10' : '\xf0';
        return pixels;
    }

    /// A volume file of the images named, one slice each.
    void writeVolume(const QByteArray& name, const std::vector<std::string>& sopUIDs,
                     const QMap<QByteArray, QByteArray>& attributes = {{"G0020-000E", "UI:1.2.3"}})
    {
        Result result;
        const int slices = qMax(1, static_cast<int>(sopUIDs.size()));
        const Lattice lattice{"Level0", {kSize, kSize, slices}, PrimitiveType::UInt8, 1};
        const auto writer = OrlanMeshWriter::create(path(name), lattice, result);
        ASSERT_NE(writer, nullptr) << qPrintable(result.text());
        const TypedData2D pixels{kSize, kSize, 1, PrimitiveType::UInt8, halfBright()};
        for (int z = 0; z < slices; ++z)
            ASSERT_TRUE(writer->writeSlice(z, pixels).good());
        ParamBundle dicom;
        for (auto it = attributes.cbegin(); it != attributes.cend(); ++it)
            dicom.insert(it.key(), Parameter::ofText(it.value()));
        ParamBundle parameters;
        parameters.insertBundle("DICOM", dicom);
        parameters.insertBundle("SOPInstanceUIDs", SOPInstanceUtility::bundleOf(sopUIDs));
        parameters.insert("BoundingBox", Parameter::ofReals({0, 31, 0, 31, -5, 5}));
        parameters.insert("PaddingValue", Parameter::ofIntegers({7}));
        parameters.insert("PaddingRangeMin", Parameter::ofIntegers({1}));
        parameters.insert("PaddingRangeMax", Parameter::ofIntegers({2}));
        if (mRange != 0)
            parameters.insert("DataMinMax", Parameter::ofIntegers({0, mRange}));
        ASSERT_TRUE(writer->writeParameters(parameters).good());
        if (mBins != 0) {
            EXPECT_TRUE(writer->writeDataSection("Histogram", QVector<quint64>(mBins, 1)).good());
        }
        ASSERT_TRUE(writer->finish().good());
    }

    static QAData edit(const Uids& images, const Substitutions& substitutions, const char* study = "1")
    {
        QAData job;
        job.studyUID = study;
        job.substitutions = substitutions;
        job.timestamp = "20240131120000";
        job.login = "anna";
        job.images = images;
        return job;
    }

    /// To series STUDY.5 of another study.
    static QAData move(const Uids& images, const char* from, const char* to, Substitutions more = {})
    {
        more.append({DCM_SeriesInstanceUID, QString::fromLatin1(QByteArray(to) + ".5")});
        QAData job = edit(images, more, to);
        job.oldStudyUID = from;
        return job;
    }

    static void correct(QAData job)
    {
        QString message;
        EXPECT_TRUE(TagFile::applyQA(job, message)) << message.toStdString();
        EXPECT_TRUE(job.outcome.notFound.isEmpty());
    }

    /// Why a job is refused: because others hold a study, or because of what it asks for.
    static std::string refusal(QAData job, ChangeFault fault = ChangeFault::Refused)
    {
        QString message;
        EXPECT_FALSE(TagFile::applyQA(job, message));
        EXPECT_EQ(job.outcome.fault, fault) << message.toStdString();
        return message.toStdString();
    }

    /// Every image of the studies and what it shows, with the VRs.
    static std::string shown(const Uids& studies)
    {
        std::string all;
        for (const QByteArray& study : studies) {
            TagFile file;
            file.readCacheFileForStudy(study, false);
            all += study.toStdString() + ":\n" + imagesText(file);
        }
        return all;
    }

    static Uids imagesIn(const char* study)
    {
        TagFile file;
        file.readCacheFileForStudy(study, false);
        return file.imagesByUID().keys();
    }

    static QByteArray value(const char* study, const char* uid, const DcmTagKey& key)
    {
        TagFile file;
        file.readCacheFileForStudy(study, false);
        QByteArray text;
        const TagMap* found = file.findImage(uid);
        return found != nullptr && found->findAndGetString(key, text) ? text : QByteArray("none");
    }

    /// Whatever is built again, every image shows what it showed. Which series of one name is the second of it follows
    /// the order in which they came.
    void expectSurvival(const Uids& of)
    {
        const std::regex label(" 0006,7120 [^\n]*\n");
        const std::string before = std::regex_replace(shown(of), label, "");
        buildAll();
        EXPECT_EQ(std::regex_replace(shown(of), label, ""), before);
    }

    using Files = std::map<QByteArray, QByteArray>;

    /// The tag files of the studies, and putting them back as if a process had died before it wrote them.
    static Files tagFiles(const Uids& studies)
    {
        Files files;
        for (const QByteArray& study : studies) {
            const QString path = TagFile::cacheFilePathForStudy(study);
            if (QFile::exists(path))
                files[study] = fileContent(path);
        }
        return files;
    }

    static void putBack(const Uids& studies, const Files& files)
    {
        for (const QByteArray& study : studies) {
            const QString path = TagFile::cacheFilePathForStudy(study);
            QFile::remove(path);
            if (files.count(study) > 0)
                putFile(path, files.at(study));
        }
    }

    TemporaryStore mStore;
    QByteArray mAddress = "sqlite:" + mStore.filePath("catalogue.db").toUtf8();
    std::unique_ptr<Kxg::Catalogue> mCatalogue;
    TagFileGenerator mGenerator;
    int mBins = 0;   // of the histograms of volume files
    int mRange = 0;  // their greatest value, if it is told
};

}  // namespace Kdd
