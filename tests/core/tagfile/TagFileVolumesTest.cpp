#include "TagFileFixture.h"
#include "kddlib/volumes/Volume.h"
#include "kddlib/volumes/VolumeInfo.h"

namespace Kdd
{
namespace
{

const DcmTagKey kVolumeIndex(0x0006, 0x7103);

/// A study of six images in one series, numbered from 1.
class TagFileVolumesTest : public TagFileTest
{
protected:
    TagFileVolumesTest()
    {
        for (int i = 1; i <= 6; ++i)
            add(file, imageNumbered(i));
    }

    static DatasetBuilder imageNumbered(int i)
    {
        const QByteArray number = QByteArray::number(i);
        return anImage(number.constData()).with(DCM_InstanceNumber, number.constData());
    }

    static VolumeInfo info(const std::vector<std::string>& imageUIDs, const char* name = "1-volume.vol")
    {
        VolumeInfo info;
        info.imageUIDs = imageUIDs;
        info.name = name;
        info.dims = {4, 4, static_cast<int>(imageUIDs.size())};
        info.histogram = KxHistogram({3, 4}, 0, 100);
        return info;
    }

    void addVolumes(std::vector<VolumeInfo> infos)
    {
        std::vector<VolumeInfo*> pointers;
        for (VolumeInfo& each : infos)
            pointers.push_back(&each);
        file.addVolumeInfo(pointers);
    }

    QByteArray indexesOf(const char* sopUID) const
    {
        const TagElement* held = file.findImage(sopUID)->findElement(kVolumeIndex);
        return held != nullptr ? held->value().toHex() : "none";
    }

    const QList<Volume*>& volumes() const { return file.seriesByUID().first()->volumes(); }

    TagFile file;
};

TEST_F(TagFileVolumesTest, AnImageInSeveralVolumesListsThemByteByByte)
{
    const LogCapture log;
    addVolumes(
        {info({"1", "2", "3"}), info({"nobody"}), info({"4", "3", "stranger"}, "1-volume_part003.vol")});
    EXPECT_EQ(indexesOf("1"), "00");
    EXPECT_EQ(indexesOf("3"), "0002");
    EXPECT_EQ(indexesOf("4"), "02");
    EXPECT_EQ(indexesOf("5"), "none");
    ASSERT_EQ(volumes().size(), 2) << "a volume without images is not made";
    EXPECT_EQ(volumes().last()->volumeIndex(), 2);
    EXPECT_EQ(volumes().last()->fileNameSuffix(), "volume_3");
    EXPECT_EQ(volumes().last()->sopUIDList(), (std::vector<std::string>{"4", "3"}))
        << "slices keep the file's order";
    EXPECT_EQ(log.count("3D volume 1-volume_part003.vol contains unknown image stranger"), 1);
}

TEST_F(TagFileVolumesTest, VolumesAndTheirImagesComeBackFromTheFile)
{
    addVolumes({info({"1", "2", "3"}), info({"6", "5", "4"}, "1-volume_part002.vol")});
    file.optimizeAll();
    TagFile again;
    ASSERT_TRUE(read(again, written(file)));
    const QList<Volume*>& volumesAgain = again.seriesByUID().first()->volumes();
    ASSERT_EQ(volumesAgain.size(), 2);
    for (int i = 0; i < 2; ++i) {
        EXPECT_EQ(volumesAgain.at(i)->sopUIDList(), volumes().at(i)->sopUIDList());
        EXPECT_EQ(volumesAgain.at(i)->volumeHash(), volumes().at(i)->volumeHash());
        EXPECT_EQ(volumesAgain.at(i)->histogram().total(), 7U);
    }
}

TEST_F(TagFileVolumesTest, ADuplicateHasImagesOfItsOwn)
{
    addVolumes({info({"3", "1", "2"})});
    TagMap& series = *file.seriesByUID().first();
    const Volume* copy = volumes().first()->duplicate(file, series);
    EXPECT_EQ(file.imagesByUID().size(), 9);
    ASSERT_EQ(copy->numImages(), 3);
    for (int i = 0; i < 3; ++i) {
        QByteArray number;
        copy->image(i)->findAndGetString(DCM_InstanceNumber, number);
        EXPECT_EQ(number, QByteArray::number(i + 1));
        EXPECT_EQ(file.findImage(copy->image(i)->uid(TagMap::ImageLevel)), copy->image(i));
        EXPECT_EQ(indexesOf(copy->image(i)->uid(TagMap::ImageLevel)), "02");
    }
    EXPECT_NE(copy->volumeHash(), volumes().first()->volumeHash());
    EXPECT_EQ(copy->dims().z, 3);
}

/// A series with volumes keeps them, whichever of the two has more images.
TEST_F(TagFileVolumesTest, AMergeKeepsVolumes)
{
    addVolumes({info({"1", "2", "3"})});
    ASSERT_TRUE(file.mergeIntoCacheFile());
    TagFile many;
    for (int i = 4; i <= 14; ++i)
        add(many, imageNumbered(i));
    ASSERT_TRUE(many.mergeIntoCacheFile());
    TagFile whole;
    ASSERT_TRUE(whole.readCacheFileForStudy("1.2", false));
    ASSERT_EQ(whole.imagesByUID().size(), 14);
    ASSERT_EQ(whole.seriesByUID().first()->volumes().size(), 1);
    EXPECT_EQ(whole.seriesByUID().first()->volumes().first()->sopUIDList(), volumes().first()->sopUIDList());
    file.clear();
    add(file, imageNumbered(20));
    addVolumes({info({"20"})});
    ASSERT_TRUE(file.mergeIntoCacheFile());
    ASSERT_EQ(volumes().size(), 1) << "the fresh volume was made from all that is known";
    EXPECT_EQ(volumes().first()->sopUIDList(), std::vector<std::string>{"20"});
    EXPECT_EQ(indexesOf("1"), "none");
}

}  // namespace
}  // namespace Kdd
