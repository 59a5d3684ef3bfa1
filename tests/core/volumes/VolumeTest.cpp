#include "kddlib/volumes/Volume.h"

#include "kddlib/tagmodel/TagMap.h"

#include <dcmtk/dcmdata/dcdeftag.h>
#include <gtest/gtest.h>

#include <memory>

using namespace Kdd;

namespace
{

using UIDs = std::vector<std::string>;

class OpenVolume : public Volume
{
public:
    using Volume::setImages;
    using Volume::setMultiFrameInfo;
    using Volume::setSlices;
};

class VolumeTest : public testing::Test
{
protected:
    TagMap* anImage(const char* sopUID, int number)
    {
        mImages.push_back(std::make_unique<TagMap>());
        mImages.back()->putAndInsertString(DCM_SOPInstanceUID, sopUID);
        mImages.back()->putAndInsertInt(DCM_InstanceNumber, number);
        return mImages.back().get();
    }

    OpenVolume volume;
    std::vector<std::unique_ptr<TagMap>> mImages;
};

TEST_F(VolumeTest, ImagesAreOrderedByNumberAndThenByTheBytesOfTheirUID)
{
    volume.setImages({anImage("1.2.9", 4), anImage("1.5", -1), anImage("1.2.10", 4), anImage("1.1", 10)},
                     nullptr);
    volume.setSlices({{0, 0}, {1, 0}, {2, 0}, {3, 0}});
    EXPECT_EQ(volume.sopUIDList(), (UIDs{"1.5", "1.2.10", "1.2.9", "1.1"}));
}

TEST_F(VolumeTest, FramesNameTheSortedImagesAndElseSlicesKeepTheirOrder)
{
    for (const auto& image : {anImage("1.2", 2), anImage("1.1", 1), anImage("local", 3)})
        volume.setImages({}, image);
    OpenVolume stack = volume;
    stack.setMultiFrameInfo({});
    EXPECT_EQ(stack.sopUIDList(), (UIDs{"1.2", "1.1", "local"}));
    volume.setMultiFrameInfo({"1.2.3", "1.1.0", "1.20.1", "1.1.x", "local"});
    EXPECT_EQ(volume.sopUIDList(), (UIDs{"1.2.3", "1.1.0", "1.1.0", "local.0"}));
    int frame = 0;
    EXPECT_EQ(volume.imageForSlice(0, frame), volume.image(1));
    EXPECT_EQ(frame, 3);
    for (const int unknown : {2, 7, -1})
        EXPECT_EQ(volume.imageForSlice(unknown, frame), nullptr) << unknown;
    ASSERT_EQ(mImages.front().get(), volume.image(1));
    mImages.erase(mImages.begin());
    EXPECT_EQ(volume.sopUIDList(), (UIDs{"1.1.0", "1.1.0", "local.0"}));
}

TEST_F(VolumeTest, TheHashIsThatOfAllIdentifiersAndIsKept)
{
    volume.setImages({anImage("1.2.3", 1), anImage("1.2.4", 2)}, nullptr);
    OpenVolume frames = volume;
    volume.setSlices({{0, 0}, {1, 0}});
    EXPECT_EQ(volume.volumeHash(), "2F69F730DE7A4AE3E9EE57BF5EEA1B9E");  // of 1.2.31.2.4
    frames.setSlices({{0, 1}, {0, 2}, {1, 1}});
    EXPECT_EQ(frames.volumeHash(), "924831375790DD6981F2B5C90091D3E0");  // of 1.2.3.11.2.3.21.2.4.1
    volume.setSlices({});
    EXPECT_EQ(volume.volumeHash(), "2F69F730DE7A4AE3E9EE57BF5EEA1B9E");
}

TEST(VolumesOfANode, AreItsOwnAndOnlySharedByItsCopies)
{
    TagMap series;
    Volume guest;
    series.addBareVolume(new Volume);
    series.addBareVolume(series.volumes().first());
    series.volumes().first()->setFileNameSuffix("suffix");
    {
        TagMap copy(series);
        copy.addBareVolume(&guest);
        EXPECT_EQ(copy.volumes(), (QList<Volume*>{series.volumes().first(), &guest}));
        copy.clearVolumes();
        EXPECT_TRUE(copy.volumes().isEmpty());
        copy = series;
    }
    ASSERT_EQ(series.volumes().size(), 1);
    EXPECT_EQ(series.volumes().first()->volumeIndex() + guest.volumeIndex(), 1 + 2);
    series.removeTagsNotNeededByClient();
    EXPECT_EQ(series.volumes().first()->fileNameSuffix(), "");
}

TEST(VolumeFileName, HasASuffix)
{
    const std::pair<const char*, const char*> files[] = {
        {"x-y-z.dat", "y-z"},     {"vol.1.dat", "vol"}, {"ab-series_part007.vol", "series_7"},
        {"a.b-c_part2x3", "c_2"}, {"a-", ""},           {nullptr, ""},
    };
    for (const auto& [file, suffix] : files)
        EXPECT_EQ(Volume::fileNameSuffix(file), QByteArray(suffix)) << suffix;
}

}  // namespace
