#include "TagFileFixture.h"

#include <algorithm>

namespace Kdd
{
namespace
{

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
        return aVolume(imageUIDs, name);
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
    add(file, imageNumbered(7).inSeries("1.2.9"));
    addVolumes(file, {info({"1", "2", "7", "3"}), info({"nobody"}),
                      info({"4", "3", "stranger"}, "1-volume_part003.vol")});
    EXPECT_EQ(log.count("3D volume 1-volume.vol contains image 7 of another series, 1.2.9"), 1);
    EXPECT_EQ(indexesOf("7"), "none");
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

/// The volumes, by their suffixes, as a reader finds them: the images of their slices.
class WrittenVolumes : public TagFileVolumesTest
{
protected:
    std::string reread()
    {
        TagFile again;
        EXPECT_TRUE(read(again, written(file)));
        std::string text;
        for (const Volume* volume : again.seriesByUID().first()->volumes()) {
            text += volume->fileNameSuffix().toStdString() + ':';
            for (int i = 0, frame = 0; i < volume->slices().size(); ++i) {
                const TagMap* image = volume->imageForSlice(i, frame);
                text += ' ' + (image != nullptr ? image->uid(TagMap::ImageLevel).toStdString() : "-");
            }
            text += '\n';
        }
        return text;
    }
};

TEST_F(WrittenVolumes, StayRightWhenOneHasLostItsImages)
{
    const LogCapture log;
    addVolumes(file, {info({"1", "2"}, "x-a.vol"), info({"3"}, "x-b.vol"), info({"5", "4"}, "x-c.vol")});
    const char* uids[] = {"3", "2"};
    file.removeImages(2, uids);
    EXPECT_EQ(reread(), "a: 1 -\nc: 5 4\n");
    EXPECT_EQ(log.count("it has lost its last image"), 1);
    EXPECT_EQ(volumes().size(), 2);
}

TEST_F(WrittenVolumes, StayRightWhenIndexesRepeat)
{
    addVolumes(file, {info({"1", "2"}, "x-a.vol"), info({"3", "2"}, "x-b.vol")});
    addVolumes(file, {info({"4", "2"}, "x-c.vol"), info({"nobody"}), info({"5", "6", "5"}, "x-d.vol")});
    EXPECT_EQ(reread(), "a: 1 2\nc: 4 2\nb: 3 2\nd: 5 6 5\n");
    EXPECT_EQ(reread(), "a: 1 2\nc: 4 2\nb: 3 2\nd: 5 6 5\n");
}

TEST_F(WrittenVolumes, StayRightWhereOneByteCannotTellThemApart)
{
    std::vector<VolumeInfo> infos;
    std::string expected;
    for (int i = 1; i <= 300; ++i) {
        const bool isShared = i == 7 || i == 290;
        infos.push_back(info({isShared ? "1" : "2"}, ("x-" + std::to_string(i) + ".vol").c_str()));
        const QByteArray uid = "a" + QByteArray::number(i);
        add(file, imageNumbered(i).with(DCM_SOPInstanceUID, uid.constData()));
        if (!isShared)
            infos.back().imageUIDs = {uid.toStdString()};
        (isShared ? expected.insert(i == 7 ? 0 : 5, std::to_string(i) + ": 1\n")
                  : expected += std::to_string(i) + ": " + uid.toStdString() + '\n');
    }
    addVolumes(file, infos);
    EXPECT_EQ(reread(), expected);
}

TEST_F(WrittenVolumes, AreLeftOutWhenNoByteIsLeft)
{
    const LogCapture log;
    std::vector<VolumeInfo> infos;
    for (int i = 0; i < 257; ++i)
        infos.push_back(info({"1"}, ("x-" + std::to_string(i) + ".vol").c_str()));
    addVolumes(file, infos);
    ASSERT_EQ(volumes().size(), 257);
    const std::string text = reread();
    EXPECT_EQ(std::count(text.begin(), text.end(), '\n'), 256);
    EXPECT_EQ(text.find("256: "), std::string::npos);
    EXPECT_NE(text.find("255: 1\n"), std::string::npos);
    EXPECT_EQ(log.count("Volume 256 of series 1.2.3 is left out of the tag file"), 1);
}

TEST_F(TagFileVolumesTest, ADuplicateHasImagesOfItsOwn)
{
    addVolumes(file, {info({"3", "1", "2"})});
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
    addVolumes(file, {info({"1", "2", "3"})});
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
    addVolumes(file, {info({"20"})});
    ASSERT_TRUE(file.mergeIntoCacheFile());
    ASSERT_EQ(volumes().size(), 1) << "the fresh volume was made from all that is known";
    EXPECT_EQ(volumes().first()->sopUIDList(), std::vector<std::string>{"20"});
    EXPECT_EQ(indexesOf("1"), "none");
}

}  // namespace
}  // namespace Kdd
