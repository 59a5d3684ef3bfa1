#include "kddlib/TagFileGenerator.h"

#include "core/tagfile/ArchiveFixture.h"
#include "kddlib/Limits.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/volumes/Volume.h"
#include "support/HttpServer.h"
#include "support/LogCapture.h"
#include "support/RandomImages.h"

#include <QImage>

#include <tuple>

namespace Kdd
{
namespace
{

/// An archive of files in a folder of its own, registered in a database there.
class GeneratorTest : public ArchiveTest
{
protected:
    /// A square image whose right half is bright.
    static DatasetBuilder aPicture(const char* sopUID, const char* number)
    {
        return anImage(sopUID)
            .asPicture(kSize, kSize, 8)
            .data(DCM_PixelData, halfBright())
            .with(DCM_SOPClassUID, UID_CTImageStorage)
            .with(DCM_InstanceNumber, number);
    }

    /// A volume file of the images named, one slice each, whose slices are like `aPicture`.
    void addVolume(const QByteArray& name, const std::vector<std::string>& sopUIDs,
                   QMap<QByteArray, QByteArray> attributes = {})
    {
        attributes.insert("G0020-000E", "UI:1.2.3");
        writeVolume(name, sopUIDs, attributes);
        registerVolume(path(name));
    }

    void registerVolume(const QByteArray& place) { registerFiles({{}, {{place, {}, "1.2", "1.2.3"}}, {}}); }

    bool build(TagFile& file, const char* studyUID = "1.2")
    {
        std::vector<Kxg::StudySummary> studies;
        EXPECT_TRUE(mCatalogue->listStudies(studies).good());
        return !studies.empty() && TagFileGenerator().createTagFile(file, studies.front().id, studyUID);
    }

    /// Places the image of a file as it is placed while one looks through them.
    void load(TagFile& into, const QByteArray& name) const
    {
        DcmFileFormat file;
        EXPECT_TRUE(file.loadFile(path(name).constData()).good());
        std::unique_ptr<TagMap> image(TagMap::createTagMap(file.getDataset(), kDefaultValueBound));
        EXPECT_NE(TagFileGenerator::place(into, std::move(image), path(name)), nullptr);
    }

    /// What arrived, with what is known of where it lies.
    void arrive(TagFile& arrivals, const QByteArray& name)
    {
        save(aPicture(name.constData(), name.constData()), name);
        arrivals.addDicomFile(path(name).constData(), path(name).constData(), true)
            ->putAndInsertValue(kFilePath, VrCode::LO, path(name));
    }

    static int valueOf(const TagMap* node, const DcmTagKey& key)
    {
        int value = -1;
        node->findAndGetInt(key, value);
        return value;
    }
};

TEST_F(GeneratorTest, ImagesVolumesAndPreviewsBecomeOneFile)
{
    for (const char* uid : {"1", "2", "3", "4"})
        save(aPicture(uid, uid), uid);
    addVolume("1.2.3-volume.vol", {"1", "2", "3"});
    TagFile built;
    ASSERT_TRUE(build(built));
    TagFile file;
    ASSERT_TRUE(file.readCacheFileForStudy("1.2", false));
    EXPECT_EQ(file.imagesByUID().size(), 4);
    const TagMap* series = file.seriesByUID().first();
    EXPECT_EQ(valueOf(series, kHasVolumeFile), 1);
    ASSERT_EQ(series->volumes().size(), 1);
    const Volume& volume = *series->volumes().first();
    EXPECT_EQ(volume.sopUIDList(), (std::vector<std::string>{"1", "2", "3"}));
    EXPECT_EQ(volume.dims().z, 3);
    EXPECT_EQ(QImage::fromData(volume.previewData()).size(), QSize(kSize, kSize));
    EXPECT_EQ(file.findImage("1")->findElement(kPreview), nullptr) << "its volume shows it";
    const TagElement* preview = file.findImage("4")->findElement(kPreview);
    ASSERT_NE(preview, nullptr);
    const QImage picture = QImage::fromData(preview->value());
    EXPECT_LT(qGray(picture.pixel(2, 16)), 30);
    EXPECT_GT(qGray(picture.pixel(29, 16)), 220);
    EXPECT_EQ(filePathOf(*file.findImage("4")), path("4"));
}

TEST_F(GeneratorTest, AHistogramNeedsARangeOrABinForEveryValue)
{
    const std::tuple<int, int, double> cases[] = {{3, 90, 90}, {256, 0, 255}, {3, 0, 0}, {256, 8, 8}};
    const LogCapture log;
    save(anImage("8"), "8");
    for (const auto& [bins, range, greatest] : cases) {
        mBins = bins;
        mRange = range;
        addVolume("a.vol", {"8"});
        TagFile file;
        ASSERT_TRUE(build(file));
        const KxHistogram& histogram = file.seriesByUID().first()->volumes().first()->histogram();
        EXPECT_EQ(histogram.maximum(), greatest);
        EXPECT_EQ(histogram.numBins(), greatest == 0 ? 0 : bins);
    }
    EXPECT_EQ(log.count("3D volume " + path("a.vol").toStdString() + " has no usable histogram"), 1);
}

/// Whatever the order of the bytes of their names.
TEST_F(GeneratorTest, PartsKeepTheirNumbersAndNamesThroughASync)
{
    for (int part = 1; part <= 12; ++part) {
        const QByteArray number = QByteArray::number(part);
        save(anImage(number), number);
        if (part != 5)
            addVolume("1.2.3-volume" + (part > 1 ? "_part" + number : QByteArray()) + ".vol",
                      {number.toStdString()});
    }
    TagFile file;
    ASSERT_TRUE(build(file));
    ASSERT_TRUE(file.readAndSync("1.2", ""));
    const QList<Volume*>& volumes = file.seriesByUID().first()->volumes();
    ASSERT_EQ(volumes.size(), 11);
    for (int i = 0; i < volumes.size(); ++i) {
        const int part = i < 4 ? i + 1 : i + 2;
        EXPECT_EQ(volumes.at(i)->volumeIndex(), i);
        EXPECT_EQ(volumes.at(i)->sopUIDList(), std::vector<std::string>{std::to_string(part)});
        EXPECT_EQ(Volume::fileNameSuffix(volumes.at(i)->volumeFileName().constData()),
                  volumes.at(i)->fileNameSuffix());
        EXPECT_TRUE(part == 1 || volumes.at(i)->fileNameSuffix() == "volume_" + QByteArray::number(part));
    }
}

TEST_F(GeneratorTest, ASyncRemovesImagesWhoseSeriesHasOnlyAVolumeFileLeft)
{
    save(anImage("8"), "8");
    save(anImage("9"), "9");
    addVolume("1.2.3-volume.vol", {"8", "9"});
    TagFile file;
    ASSERT_TRUE(build(file));
    ASSERT_TRUE(mCatalogue->removeFiles({path("8"), path("9")}).good());
    ASSERT_TRUE(file.readAndSync("1.2", ""));
    EXPECT_TRUE(file.imagesByUID().isEmpty());
    EXPECT_EQ(file.seriesByUID().keys(), Uids{"1.2.3"});
}

TEST_F(GeneratorTest, WhatCannotBeUsedIsNamedAndLeftOut)
{
    anImage("foreign").inStudy("1.9").save(QFile::decodeName(path("a-foreign")));
    Kxg::DicomFileRecord foreign;
    foreign.path = path("a-foreign");
    foreign.studyInstanceUID = "1.2";
    foreign.seriesInstanceUID = "1.2.3";
    foreign.sopInstanceUID = "foreign";
    registerFiles({{foreign}, {}, {}});
    for (const char* name : {"b", "c", "d"})
        save(anImage(name), name);
    QFile::remove(QString::fromLocal8Bit(path("c")));
    addVolume("damaged.vol", {"b"});
    ASSERT_TRUE(QFile(QString::fromLocal8Bit(path("damaged.vol"))).resize(500));
    addVolume("nameless.vol", {});
    const LogCapture log;
    TagFile file;
    ASSERT_TRUE(build(file));
    EXPECT_EQ(file.imagesByUID().keys(), (Uids{"b", "d"}));
    EXPECT_EQ(log.count("File " + path("a-foreign").toStdString() + " does not belong to study 1.2"), 1);
    EXPECT_EQ(log.count("Could not open " + path("c").toStdString() + ": "), 1);
    EXPECT_EQ(log.count("damaged.vol"), 1);
    EXPECT_EQ(log.count("Could not get SOP list for 3D volume " + path("nameless.vol").toStdString()), 1);
}

TEST_F(GeneratorTest, AVolumeOfFramesNamesEachImageOnce)
{
    save(anImage("8"), "8");
    save(anImage("9"), "9");
    addVolume("frames.vol", {"8.0", "8.1", "9.0"}, {{"G0028-0008", "IS:2"}, {"G0008-0060", "CS:MG"}});
    TagFile file;
    ASSERT_TRUE(build(file));
    const QList<Volume*>& volumes = file.seriesByUID().first()->volumes();
    ASSERT_EQ(volumes.size(), 1);
    EXPECT_EQ(volumes.first()->numImages(), 2);
    EXPECT_EQ(volumes.first()->sopUIDList(), (std::vector<std::string>{"8.0", "8.1", "9.0"}));
    EXPECT_EQ(volumes.first()->paddingValue().value_or(0), 1);
    EXPECT_EQ(volumes.first()->paddingRangeLimit().value_or(0), 2);
    EXPECT_NE(file.findImage("8")->findElement(DcmTag(0x0071, 0x0070, "Korvex")), nullptr)
        << "a mammogram is navigated";
}

TEST_F(GeneratorTest, VolumesAreFetchedFromTheirUrls)
{
    save(anImage("8"), "8");
    writeVolume("a.vol", {"8"});
    const NginxServer server;
    server.addFile("a.vol", fileContent(QFile::decodeName(path("a.vol"))));
    registerVolume(QByteArray::fromStdString(server.url("/a.vol")));
    registerVolume(QByteArray::fromStdString(server.url("/gone.vol")));
    const LogCapture log;
    TagFile file;
    ASSERT_TRUE(build(file));
    EXPECT_EQ(file.seriesByUID().first()->volumes().size(), 1);
    EXPECT_EQ(log.count("Reading " + server.url("/gone.vol") + " failed: HTTP response code 404"), 1);
}

/// Whatever came in whatever order, and what was put in and taken out again meanwhile.
TEST_F(GeneratorTest, WhatIsLoadedAlreadyMakesTheSameFile)
{
    RandomImages random(7);
    Uids names;
    for (int i = 10; i < 40; ++i) {
        names.append(QByteArray::number(i));
        delete random.next(names.last());
        save(random.last(), names.last());
    }
    const auto fileBuiltWith = [&](TagFile& loaded) {
        std::vector<Kxg::StudySummary> list;
        EXPECT_TRUE(mCatalogue->listStudies(list).good());
        const Kxg::StudySummary& study = list.front();
        TagFile built;
        EXPECT_TRUE(
            TagFileGenerator().createTagFile(built, study.id, study.studyInstanceUID.constData(), loaded));
        return fileContent(TagFile::cacheFilePathForStudy(study.studyInstanceUID));
    };
    TagFile nothing;
    const QByteArray expected = fileBuiltWith(nothing);
    const Uids backwards(names.crbegin(), names.crend());
    // A name with "-" in front is taken out.
    const std::pair<const char*, Uids> cases[] = {
        {"all, in their order", names},
        {"backwards", backwards},
        {"the first replaced", names + Uids{"10"}},
        {"the first taken out and put back", names + Uids{"-10", "10"}},
        {"without the first", names + Uids{"-10"}},
    };
    for (const auto& [what, steps] : cases) {
        TagFile loaded;
        for (const QByteArray& step : steps) {
            const char* gone = step.constData() + 1;
            if (step.startsWith('-'))
                EXPECT_EQ(loaded.removeImages(1, &gone), 1);
            else
                load(loaded, step);
        }
        EXPECT_EQ(fileBuiltWith(loaded), expected) << what;
        EXPECT_EQ(loaded.isEmpty(), steps == names) << what << ": whether it was taken over";
    }
}

TEST_F(GeneratorTest, ADatabaseThatCannotAnswerFailsTheBuild)
{
    const LogCapture log;
    TagFile file;
    EXPECT_FALSE(TagFileGenerator().createTagFile(file, 12345, nullptr));
    EXPECT_EQ(log.count("Database query GetAllFilesOfStudy() failed."), 1);
}

TEST_F(GeneratorTest, ArrivalsGetThePreviewsThatTheWholeStudyWants)
{
    TagFile arrivals;
    TagFile more;
    for (int number = 10; number <= 20; ++number)
        arrive(arrivals, QByteArray::number(number));
    TagFileGenerator().completeArrivals(arrivals);
    EXPECT_NE(arrivals.findImage("10")->findElement(kPreview), nullptr) << "a short series shows all";
    ASSERT_TRUE(arrivals.mergeIntoCacheFile());
    for (int number = 10; number <= 20; ++number)
        arrive(more, QByteArray::number(100 * number));
    TagFileGenerator().completeArrivals(more);
    int previews = 0;
    for (const TagMap* image : more.imagesByUID())
        previews += image->findElement(kPreview) != nullptr ? 1 : 0;
    EXPECT_EQ(previews, 1) << "of 22 the one in the middle";
}

}  // namespace
}  // namespace Kdd
