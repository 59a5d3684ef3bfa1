#include "TagFileFixture.h"
#include "platform/database/DirectoryEntry.h"

namespace Kdd
{
namespace
{

using Entry = Kxg::DicomDirectoryEntry;

/// What the database says, and two series "1.2.3" (images 1 and 2) and "1.2.4" (image 3) in the tag file.
class TagFileSyncTest : public TagFileTest
{
protected:
    TagFileSyncTest()
    {
        add(file, anImage("1"), "/old/1");
        add(file, anImage("2"), "/old/2");
        add(file, anImage("3").inSeries("1.2.4"), "/old/3");
        study->studyInstanceUID = "1.2";
    }

    Entry& listSeries(const char* uid, const std::vector<Kxg::ImageFile>& images)
    {
        Entry series;
        series.type = Entry::SeriesEntry;
        series.seriesInstanceUID = uid;
        series.modality = "CT";
        series.seriesInfo = std::make_shared<Kxg::SeriesInfo>();
        series.seriesInfo->images = images;
        study->entries.push_back(series);
        return study->entries.back();
    }

    static Entry volumeFile(const char* name)
    {
        Entry entry;
        entry.type = Entry::VolumeFile;
        entry.flags = Entry::HasVolume;
        entry.name = name;
        return entry;
    }

    static QList<QByteArray> namesOf(const TagMap& series)
    {
        QList<QByteArray> names;
        for (const Volume* volume : series.volumes())
            names.append(volume->volumeFileName());
        return names;
    }

    static QByteArray textOf(const TagMap* node, const DcmTagKey& key)
    {
        QByteArray text;
        node->findAndGetString(key, text);
        return text;
    }

    TagFile file;
    std::shared_ptr<Entry> study = std::make_shared<Entry>();
};

TEST_F(TagFileSyncTest, TheTreeBecomesWhatTheDatabaseLists)
{
    const LogCapture log;
    listSeries("1.2.3", {{"2", "D:\\store\\2.dcm"}, {"9", "/new/9"}});
    listSeries("1.2.7", {});
    EXPECT_TRUE(file.syncWithDatabase(study));
    EXPECT_EQ(file.imagesByUID().keys(), Uids{"2"});
    EXPECT_EQ(textOf(file.findImage("2"), kFilePath), "D:/store/2.dcm");
    EXPECT_EQ(textOf(file.findImage("2"), DCM_PatientName),
              textOf(&*std::unique_ptr<TagMap>(anImage("2").map()), DCM_PatientName));
    EXPECT_EQ(file.seriesByUID().keys(), (Uids{"1.2.3", "1.2.7"}));
    EXPECT_EQ(log.count("Image 9 not found in tag map"), 1);
    EXPECT_EQ(log.count("Series 1.2.7 not found in tag map"), 1);
    EXPECT_FALSE(file.syncWithDatabase(study)) << "nothing changes any more";
}

TEST_F(TagFileSyncTest, ADatabaseThatSaysNothingRemovesNothing)
{
    EXPECT_FALSE(file.syncWithDatabase(nullptr));
    EXPECT_FALSE(file.syncWithDatabase(study)) << "a study without series";
    listSeries("1.2.3", {}).seriesInfo = nullptr;
    listSeries("1.2.4", {{"3", "/old/3"}});
    file.syncWithDatabase(study);
    EXPECT_EQ(file.imagesByUID().size(), 3);
}

TEST_F(TagFileSyncTest, AnImageKnownByItsPathStaysOrGoesWithItsRow)
{
    const auto withoutUID = [] { return anImage().without(DCM_SOPInstanceUID); };
    add(file, withoutUID(), "D:\\old\\a.dcm");
    add(file, withoutUID(), "/old/b");
    listSeries("1.2.3", {{"1", "/old/1"}, {"", "D:\\old\\a.dcm"}});
    EXPECT_TRUE(file.syncWithDatabase(study));
    EXPECT_EQ(file.imagesByUID().keys(), (Uids{"1", "D:/old/a.dcm"}));
    EXPECT_EQ(file.findSeries("1.2.3")->children().size(), 2);
    EXPECT_FALSE(file.syncWithDatabase(study)) << "it is found under the path that was stored";
    const char* uids[] = {"D:\\old\\a.dcm", "1"};
    EXPECT_EQ(file.removeImages(2, uids), 2);
    EXPECT_TRUE(file.isEmpty());
}

TEST_F(TagFileSyncTest, AnImageIsLetGoOfUnderWhateverKey)
{
    file.findImage("1")->putAndInsertString(DCM_SOPInstanceUID, "other");
    file.findImage("1")->deleteElement(kFilePath);
    file.findSeries("1.2.4")->putAndInsertString(DCM_SeriesInstanceUID, "other");
    file.findImage("2")->putAndInsertValue(kFilePath, VrCode::LO, "/2");
    file.findSeries("1.2.3")->putAndInsertValue(kFilePath, VrCode::LO, "/of/the/series");
    file.removeImagesWithoutFilename(file.findSeries("1.2.3"));
    EXPECT_EQ(file.imagesByUID().keys(), (Uids{"2", "3"}));
    EXPECT_EQ(file.findSeries("1.2.3")->children(), QList<TagMap*>{file.findImage("2")});
    const char* uids[] = {"3"};
    EXPECT_EQ(file.removeImages(1, uids), 1);
    EXPECT_EQ(file.seriesByUID().keys(), Uids{"1.2.3"});
}

TEST_F(TagFileSyncTest, AnotherStudysEntryIsRefused)
{
    const LogCapture log;
    listSeries("1.2.3", {});
    study->studyInstanceUID = "1.9";
    const std::string before = treeText(file);
    EXPECT_FALSE(file.syncWithDatabase(study));
    file.copyDatabaseValuesIntoTagMap(*study);
    EXPECT_EQ(treeText(file), before);
    EXPECT_EQ(log.count("1.9"), 2);
}

TEST_F(TagFileSyncTest, ASkeletonInheritsAndHidesNothing)
{
    file.findSeries("1.2.3")->putAndInsertInt(kHasVolumeFile, 1);
    listSeries("1.2.7", {}).modality = "MR";
    Kxg::SeriesInfo info;
    info.images = {{"8", "/new/8"}};
    bool complete = true;
    file.copyDatabaseValuesIntoTagMap(*study);
    EXPECT_EQ(file.addDicomFilePaths(file.findSeries("1.2.7"), &info, true, complete), 1);
    EXPECT_TRUE(complete);
    const TagMap* image = file.findImage("8");
    EXPECT_EQ(image->parent(), file.findSeries("1.2.7"));
    EXPECT_TRUE(image->tagsForLevel().value(DCM_PixelData)->markedAsOmitted());
    for (const DcmTagKey& key : {DCM_PatientName, DCM_StudyInstanceUID})
        EXPECT_EQ(textOf(image, key), textOf(file.findImage("1"), key));
    EXPECT_EQ(textOf(file.findSeries("1.2.7"), DCM_Modality), "MR");
    EXPECT_EQ(textOf(image, kFileSuffix), "") << "that of another file";
    EXPECT_EQ(image->findElement(kHasVolumeFile), nullptr);
    EXPECT_EQ(textOf(image->parent()->parent(), DCM_StudyInstanceUID), "1.2");
    TagFile fresh;
    fresh.copyDatabaseValuesIntoTagMap(*study);
    TagFile again;
    EXPECT_TRUE(read(again, written(fresh), "1.2")) << "a study of skeletons has its UID";
}

TEST_F(TagFileSyncTest, ReportsAreNoSeriesOfTheSkeleton)
{
    for (const char* modality : {"SR", "PR", "SEG", "MR"})
        listSeries(modality, {}).modality = modality;
    study->entries.back().seriesTime = "12:30:00";
    file.copyDatabaseValuesIntoTagMap(*study);
    EXPECT_EQ(file.seriesByUID().keys(), (Uids{"1.2.3", "1.2.4", "MR"}));
    EXPECT_EQ(textOf(file.findSeries("MR"), DCM_SeriesTime), "123000");
    EXPECT_EQ(file.findSeries("MR")->parent(), file.study().get());
}

struct VolumeName
{
    const char* name;
    QList<QByteArray> names;  // of the series' two volumes afterwards
    int warnings;
};

const VolumeName kVolumeNames[] = {
    {"a-b.vol", {"a-b.vol", ""}, 0},
    {"a_part002.vol", {"", "a_part002.vol"}, 0},
    {"a_part2", {"", "a_part2"}, 0},
    {"a_part1", {"", ""}, 0},
    {"a_part001.vol", {"", ""}, 0},
    {"a_part.vol", {"", ""}, 0},
    {"a_part003.vol", {"", ""}, 1},
    {"a_part99999999999999.vol", {"", ""}, 1},
    {"", {"", ""}, 0},
};

TEST_F(TagFileSyncTest, TheNameOfAVolumeFileChoosesTheVolume)
{
    TagMap* series = file.findSeries("1.2.3");
    for (const VolumeName& row : kVolumeNames) {
        const LogCapture log;
        series->clearVolumes();
        series->addBareVolume(new Volume(0));
        series->addBareVolume(new Volume(1));
        file.addVolumeFilePath(series, volumeFile(row.name), false);
        EXPECT_EQ(namesOf(*series), row.names) << row.name;
        EXPECT_EQ(static_cast<int>(log.lines().size()), row.warnings) << row.name;
    }
}

TEST_F(TagFileSyncTest, VolumesAreNamedByTheirSuffixWhereTheNumbersHaveGaps)
{
    const LogCapture log;
    TagMap* series = file.findSeries("1.2.3");
    for (const char* suffix : {"volume", "volume_3", "volume_11"}) {
        series->addBareVolume(new Volume(series->volumes().size()));
        series->volumes().last()->setFileNameSuffix(suffix);
    }
    for (const char* name :
         {"x-volume_part2.vol", "y-volume_part011.vol", "x-volume_part3.vol", "x-volume.vol"})
        file.addVolumeFilePath(series, volumeFile(name), false);
    EXPECT_EQ(namesOf(*series), (Uids{"x-volume.vol", "x-volume_part3.vol", "y-volume_part011.vol"}));
    EXPECT_EQ(log.count("Volume x-volume_part2.vol not found in tag map"), 1);
}

TEST_F(TagFileSyncTest, MissingVolumesAreMadeInTheirOrder)
{
    const LogCapture log;
    TagMap* series = file.findSeries("1.2.3");
    file.addVolumeFilePath(series, volumeFile("a.vol"), true);
    file.addVolumeFilePath(series, volumeFile("a_part005.vol"), true);
    EXPECT_EQ(series->volumes().size(), 2);
    EXPECT_EQ(log.count("Invalid volume index 4 (expected 1) for a_part005.vol"), 1);
    Entry image = volumeFile("a.vol");
    image.type = Entry::DicomFile;
    file.addVolumeFilePath(series, image, true);
    EXPECT_EQ(series->volumes().size(), 2) << "a DICOM file is no volume";
    file.addVolumeFilePath(series, volumeFile("a_part005.vol"), true);
    EXPECT_EQ(series->volumes().size(), 2) << "it is there";
}

TEST_F(TagFileSyncTest, LabelsTellSeriesApart)
{
    TagFile labelled;
    const auto addSeries = [&](const char* uid, const char* number, const char* description) {
        const DatasetBuilder image = anImage(uid).inSeries(uid);
        add(labelled,
            DatasetBuilder(image).with(DCM_SeriesNumber, number).with(DCM_SeriesDescription, description))
            ->markAsOmitted(DCM_PixelData);
    };
    addSeries("1.1", "3", "axial");
    addSeries("1.2", "3", "axial (1)");
    addSeries("1.3", "3", "axial");
    add(labelled,
        anImage("1.4").inSeries("1.4").with(DCM_Modality, "SR").with(DCM_SeriesDescription, "axial"));
    labelled.createAbstractTags();
    labelled.createAbstractTags();
    QList<QByteArray> labels;
    for (const TagMap* series : labelled.seriesByUID())
        labels.append(textOf(series, kAbstract));
    EXPECT_EQ(labels, (QList<QByteArray>{"3 axial (2)", "3 axial (1)", "3 axial (3)", "SR"}));
}

}  // namespace
}  // namespace Kdd
