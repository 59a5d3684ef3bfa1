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
    for (const char* path : {"D:\\old\\a.dcm", "/old/b"})
        add(file, anImage().without(DCM_SOPInstanceUID), path);
    listSeries("1.2.3", {{"2", "D:\\store\\2.dcm"}, {"9", "/new/9"}, {"", "D:\\old\\a.dcm"}});
    listSeries("1.2.7", {});
    EXPECT_TRUE(file.syncWithDatabase(study));
    EXPECT_EQ(file.imagesByUID().keys(), (Uids{"2", "D:/old/a.dcm"}));
    EXPECT_EQ(textOf(file.findImage("2"), kFilePath), "D:/store/2.dcm");
    EXPECT_EQ(file.seriesByUID().keys(), (Uids{"1.2.3", "1.2.7"}));
    EXPECT_EQ(log.count("Image 9 not found in tag map"), 1);
    EXPECT_EQ(log.count("Series 1.2.7 not found in tag map"), 1);
    EXPECT_FALSE(file.syncWithDatabase(study)) << "nothing changes any more";
    const char* uids[] = {"D:\\old\\a.dcm", "2"};
    EXPECT_EQ(file.removeImages(2, uids), 2);
}

TEST_F(TagFileSyncTest, ADatabaseThatSaysNothingOrOfAnotherStudyChangesNothing)
{
    const LogCapture log;
    EXPECT_FALSE(file.syncWithDatabase(nullptr));
    EXPECT_FALSE(file.syncWithDatabase(study)) << "a study without series";
    const std::string before = treeText(file);
    study->studyInstanceUID = "1.9";
    listSeries("1.2.3", {}).seriesInfo = nullptr;
    EXPECT_FALSE(file.syncWithDatabase(study));
    file.copyDatabaseValuesIntoTagMap(*study);
    EXPECT_EQ(treeText(file), before);
    EXPECT_EQ(log.count("1.9"), 2);
    study->studyInstanceUID = "1.2";
    listSeries("1.2.4", {{"3", "/old/3"}});
    file.syncWithDatabase(study);
    EXPECT_EQ(file.imagesByUID().size(), 3) << "of one series it says nothing";
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
    const char* uids[] = {"3"};
    EXPECT_EQ(file.removeImages(1, uids), 1);
    EXPECT_EQ(file.seriesByUID().keys(), Uids{"1.2.3"});
}

TEST_F(TagFileSyncTest, ASkeletonInheritsAndHidesNothingAndReportsAreNoPartOfIt)
{
    file.findSeries("1.2.3")->putAndInsertInt(kHasVolumeFile, 1);
    for (const char* modality : {"SR", "PR", "SEG", "MR"})
        listSeries(modality, {}).modality = modality;
    study->entries.back().seriesTime = "12:30:00";
    Kxg::SeriesInfo info;
    info.images = {{"8", "/new/8"}};
    bool complete = true;
    file.copyDatabaseValuesIntoTagMap(*study);
    EXPECT_EQ(file.seriesByUID().keys(), (Uids{"1.2.3", "1.2.4", "MR"}));
    EXPECT_EQ(file.addDicomFilePaths(file.findSeries("MR"), &info, true, complete), 1);
    EXPECT_TRUE(complete);
    const TagMap* image = file.findImage("8");
    EXPECT_EQ(image->parent(), file.findSeries("MR"));
    EXPECT_TRUE(image->tagsForLevel().value(DCM_PixelData)->markedAsOmitted());
    for (const DcmTagKey& key : {DCM_PatientName, DCM_StudyInstanceUID})
        EXPECT_EQ(textOf(image, key), textOf(file.findImage("1"), key));
    EXPECT_EQ(textOf(image, DCM_Modality) + textOf(image, DCM_SeriesTime), "MR123000");
    EXPECT_EQ(textOf(image, kFileSuffix), "") << "that of another file";
    EXPECT_EQ(image->findElement(kHasVolumeFile), nullptr);
    TagFile fresh;
    fresh.copyDatabaseValuesIntoTagMap(*study);
    TagFile again;
    EXPECT_TRUE(read(again, written(fresh), "1.2")) << "a study of skeletons has its UID";
}

/// The suffixes of the volumes that there are, the name of a file, and the volume that is named by it or a warning.
const std::tuple<std::vector<const char*>, const char*, int, const char*> kVolumeNames[] = {
    {{"", ""}, "a-b.vol", 0, nullptr},
    {{"", ""}, "a_part002.vol", 1, nullptr},
    {{"", ""}, "a_part2", 1, nullptr},
    {{"", ""}, "a_part1", -1, nullptr},
    {{"", ""}, "a_part.vol", -1, nullptr},
    {{"", ""}, "a_part003.vol", -1, ""},
    {{"", ""}, "a_part99999999999999.vol", -1, ""},
    {{"", ""}, "", -1, nullptr},
    {{"volume", "volume_3", "volume_11"},
     "x-volume_part2.vol",
     -1,
     "x-volume_part2.vol not found in tag map"},
    {{"volume", "volume_3", "volume_11"}, "y-volume_part011.vol", 2, nullptr},
    {{"volume", "volume_3", "volume_11"}, "x-volume.vol", 0, nullptr},
};

TEST_F(TagFileSyncTest, TheNameOfAVolumeFileChoosesTheVolume)
{
    TagMap* series = file.findSeries("1.2.3");
    for (const auto& [suffixes, name, chosen, warning] : kVolumeNames) {
        const LogCapture log;
        series->clearVolumes();
        for (const char* suffix : suffixes) {
            series->addBareVolume(new Volume(series->volumes().size()));
            series->volumes().last()->setFileNameSuffix(suffix);
        }
        file.addVolumeFilePath(series, volumeFile(name), false);
        for (int i = 0; i < series->volumes().size(); ++i)
            EXPECT_EQ(series->volumes().at(i)->volumeFileName(), i == chosen ? name : "") << name;
        EXPECT_EQ(log.lines().size(), warning != nullptr ? 1U : 0U) << name;
        EXPECT_EQ(log.count(warning != nullptr ? warning : "none"), log.lines().size()) << name;
    }
}

TEST_F(TagFileSyncTest, MissingVolumesAreMadeInTheirOrder)
{
    const LogCapture log;
    TagMap* series = file.findSeries("1.2.3");
    for (int i = 0; i < 2; ++i) {
        file.addVolumeFilePath(series, volumeFile("a.vol"), true);
        file.addVolumeFilePath(series, volumeFile("a_part005.vol"), true);
        EXPECT_EQ(series->volumes().size(), 2);
    }
    EXPECT_EQ(log.count("Invalid volume index 4 (expected 1) for a_part005.vol"), 1);
}

TEST_F(TagFileSyncTest, LabelsTellSeriesApart)
{
    TagFile labelled;
    const std::array<const char*, 2> kSeries[] = {
        {{"1.1", "axial"}}, {{"1.2", "axial (1)"}}, {{"1.3", "axial"}}, {{"1.4", "report"}}};
    for (const auto& [uid, description] : kSeries) {
        DatasetBuilder image = anImage(uid).inSeries(uid).with(DCM_SeriesDescription, description);
        const bool isReport = *description == 'r';
        image.with(isReport ? DCM_Modality : DCM_SeriesNumber, isReport ? "SR" : "3");
        TagMap* added = add(labelled, image);
        if (!isReport)
            added->markAsOmitted(DCM_PixelData);
    }
    labelled.createAbstractTags();
    labelled.createAbstractTags();
    QList<QByteArray> labels;
    for (const TagMap* series : labelled.seriesByUID())
        labels.append(textOf(series, kAbstract));
    EXPECT_EQ(labels, (QList<QByteArray>{"3 axial (2)", "3 axial (1)", "3 axial (3)", "SR"}));
}

}  // namespace
}  // namespace Kdd
