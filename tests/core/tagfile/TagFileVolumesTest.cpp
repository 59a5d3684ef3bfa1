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
            addImage(QByteArray::number(i), i);
    }

    void addImage(const QByteArray& uid, int number)
    {
        add(file, anImage(uid).with(DCM_InstanceNumber, QByteArray::number(number)));
    }

    QByteArray indexesOf(const char* sopUID) const
    {
        const TagElement* held = file.findImage(sopUID)->findElement(kVolumeIndex);
        return held != nullptr ? held->value().toHex() : "none";
    }

    const QList<Volume*>& volumes() const { return file.seriesByUID().first()->volumes(); }

    /// "suffix: 1 2" for each volume, as a reader finds them.
    std::string reread()
    {
        TagFile again;
        EXPECT_TRUE(read(again, written(file)));
        std::string text;
        for (const Volume* volume : again.seriesByUID().first()->volumes()) {
            text += volume->fileNameSuffix().toStdString() + ':';
            for (const std::string& uid : volume->sopUIDList())
                text += ' ' + uid;
            text += '\n';
        }
        return text;
    }

    TagFile file;
};

TEST_F(TagFileVolumesTest, StayRightWhereOneByteCannotTellThemApart)
{
    std::vector<VolumeInfo> infos;
    std::string expected = "7: 1\n290: 1\n";
    for (int i = 1; i <= 300; ++i) {
        const QByteArray uid = i == 7 || i == 290 ? QByteArray("1") : "a" + QByteArray::number(i);
        infos.push_back(aVolume({uid.toStdString()}, ("x-" + QByteArray::number(i) + ".vol").constData()));
        if (uid == "1")
            continue;
        addImage(uid, i);
        expected += std::to_string(i) + ": " + uid.toStdString() + '\n';
    }
    addVolumes(file, infos);
    EXPECT_EQ(reread(), expected);
}

TEST_F(TagFileVolumesTest, AreLeftOutWhenNoByteIsLeft)
{
    const LogCapture log;
    std::vector<VolumeInfo> infos;
    for (int i = 0; i < 257; ++i)
        infos.push_back(aVolume({"1"}, ("x-" + QByteArray::number(i) + ".vol").constData()));
    addVolumes(file, infos);
    ASSERT_EQ(volumes().size(), 257);
    const std::string text = reread();
    EXPECT_EQ(std::count(text.begin(), text.end(), '\n'), 256);
    EXPECT_EQ(text.find("256: "), std::string::npos);
    EXPECT_EQ(log.count("Volume 256 of series 1.2.3 is left out of the tag file"), 1);
}

TEST_F(TagFileVolumesTest, ADuplicateHasImagesOfItsOwn)
{
    addVolumes(file, {aVolume({"3", "1", "2"}, "1-volume.vol")});
    const Volume* copy = volumes().first()->duplicate(file, *file.seriesByUID().first());
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

TEST_F(TagFileVolumesTest, OfAFreshSeriesAreMadeFromAllThatIsKnown)
{
    addVolumes(file, {aVolume({"1", "2", "3"}, "1-volume.vol")});
    ASSERT_TRUE(file.mergeIntoCacheFile());
    file.clear();
    addImage("20", 20);
    addVolumes(file, {aVolume({"20"}, "1-volume.vol")});
    ASSERT_TRUE(file.mergeIntoCacheFile());
    ASSERT_EQ(volumes().size(), 1);
    EXPECT_EQ(volumes().first()->sopUIDList(), std::vector<std::string>{"20"});
    EXPECT_EQ(indexesOf("1"), "none");
}

}  // namespace
}  // namespace Kdd
