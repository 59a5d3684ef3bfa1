#include "kddlib/volumes/Volume.h"

#include "kddlib/tagmodel/TagMap.h"

#include <dcmtk/dcmdata/dcdeftag.h>
#include <gtest/gtest.h>

#include <memory>

namespace
{

using Kdd::Slice;
using Kdd::SliceList;
using Kdd::TagMap;
using Kdd::Volume;

class OpenVolume : public Volume
{
public:
    using Volume::hasExtraData;
    using Volume::setImages;
    using Volume::setMultiFrameInfo;
    using Volume::setSlices;
    using Volume::Volume;
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

    std::string order() const
    {
        std::string names;
        for (int i = 0; i < volume.numImages(); ++i) {
            QByteArray uid;
            volume.image(i)->findAndGetString(DCM_SOPInstanceUID, uid);
            names += uid.toStdString() + ' ';
        }
        return names;
    }

    std::string slices() const
    {
        std::string text;
        for (int i = 0; i < volume.slices().size(); ++i) {
            const Slice slice = volume.slices().at(i);
            text += std::to_string(slice.image) + '/' + std::to_string(slice.frame) + ' ';
        }
        return text;
    }

    OpenVolume volume;

private:
    std::vector<std::unique_ptr<TagMap>> mImages;
};

TEST_F(VolumeTest, ImagesAreOrderedByNumberAndThenByTheBytesOfTheirUID)
{
    volume.setImages({anImage("1.2.9", 4), anImage("1.5", -1), anImage("1.2.10", 4), anImage("1.1", 10)},
                     nullptr);
    EXPECT_EQ(order(), "1.5 1.2.10 1.2.9 1.1 ");
    EXPECT_EQ(slices(), "");
}

TEST_F(VolumeTest, ASingleImageIsAddedToThoseAlreadyThere)
{
    volume.setImages({anImage("1.2", 7)}, nullptr);
    volume.setImages({}, anImage("1.1", 1));
    EXPECT_EQ(order(), "1.2 1.1 ");
    volume.setImages({}, nullptr);
    EXPECT_EQ(volume.numImages(), 2);
}

TEST_F(VolumeTest, FramesNameTheSortedImages)
{
    volume.setImages({}, anImage("1.2", 2));
    volume.setImages({}, anImage("1.1", 1));
    volume.setImages({}, anImage("local", 3));
    volume.setMultiFrameInfo({"1.2.3", "1.1.0", "1.20.1", "1.1.x", "local"});
    EXPECT_EQ(order(), "1.1 1.2 local ");
    EXPECT_EQ(slices(), "1/3 0/0 -1/1 0/0 2/0 ");
    EXPECT_TRUE(volume.isMultiFrame());
    EXPECT_EQ(volume.sopUIDList(), (std::vector<std::string>{"1.2.3", "1.1.0", "1.1.0", "local.0"}));
}

TEST_F(VolumeTest, WithoutFramesTheSlicesKeepTheOrderOfTheInput)
{
    for (const auto& image : {anImage("1.3", 3), anImage("1.1", 1), anImage("1.2", 2)})
        volume.setImages({}, image);
    volume.setMultiFrameInfo({});
    EXPECT_EQ(slices(), "2/0 0/0 1/0 ");
    EXPECT_FALSE(volume.isMultiFrame());
    EXPECT_EQ(volume.sopUIDList(), (std::vector<std::string>{"1.3", "1.1", "1.2"}));
}

TEST_F(VolumeTest, ASliceWithoutEntryIsTheImageOfThatNumber)
{
    volume.setImages({anImage("1.1", 1), anImage("1.2", 2), anImage("1.3", 3)}, nullptr);
    int frame = 5;
    EXPECT_EQ(volume.imageForSlice(2, frame), volume.image(2));
    EXPECT_EQ(frame, -1);
    EXPECT_EQ(volume.imageForSlice(7, frame), nullptr);
    EXPECT_EQ(volume.imageForSlice(-1, frame), nullptr);
    volume.setSlices({{1, 4}, {9, 5}, {-1, 6}});
    EXPECT_EQ(volume.imageForSlice(0, frame), volume.image(1));
    EXPECT_EQ(frame, 4);
    EXPECT_EQ(volume.imageForSlice(1, frame), nullptr);
    EXPECT_EQ(frame, 5);
    EXPECT_EQ(volume.imageForSlice(2, frame), nullptr);
}

TEST_F(VolumeTest, TheHashIsThatOfAllIdentifiersAndIsKept)
{
    volume.setImages({anImage("1.2.3", 1), anImage("1.2.4", 2)}, nullptr);
    OpenVolume frames = volume;
    volume.setSlices({{0, 0}, {1, 0}});
    EXPECT_EQ(volume.volumeHash(), "2F69F730DE7A4AE3E9EE57BF5EEA1B9E");  // of 1.2.31.2.4
    frames.setSlices({{0, 1}, {0, 2}, {1, 1}});
    std::string text;
    frames.volumeHash(text);
    EXPECT_EQ(text, "924831375790DD6981F2B5C90091D3E0");  // of 1.2.3.11.2.3.21.2.4.1
    volume.setSlices({});
    EXPECT_EQ(volume.volumeHash(), "2F69F730DE7A4AE3E9EE57BF5EEA1B9E");
}

TEST_F(VolumeTest, RescaleValuesComeFromTheImagesWhenNoneAreKnown)
{
    EXPECT_EQ(volume.rescaleSlope(), 1);
    TagMap* first = anImage("1.1", 1);
    TagMap* second = anImage("1.2", 2);
    first->putAndInsertString(DCM_RescaleSlope, " 2.5 \\7");
    first->putAndInsertString(DCM_RescaleIntercept, "-1024");
    second->putAndInsertString(DCM_RescaleSlope, "");
    second->putAndInsertInt(DCM_PixelRepresentation, 1);
    second->putAndInsertInt(DCM_BitsStored, 12);
    OpenVolume one;
    one.setImages({first}, nullptr);
    EXPECT_EQ(one.rescaleIntercept(), -1024);
    EXPECT_EQ(one.rescaleSlope(), 2.5F);
    OpenVolume other;
    other.setImages({second}, nullptr);
    EXPECT_EQ(other.rescaleIntercept(), -32768);
    other.setRescale(3, 4, 0.5F);
    EXPECT_EQ(other.precisionBitLoss(), 0.5F);
    EXPECT_EQ(other.rescaleIntercept(), 4);
}

TEST_F(VolumeTest, AForgottenImageLeavesItsSlicesWithoutImage)
{
    TagMap* second = anImage("1.2", 2);
    volume.setImages({anImage("1.1", 1), second, anImage("1.3", 3)}, nullptr);
    volume.setSlices({{0, 0}, {1, 0}, {2, 0}});
    volume.forgetImage(second);
    volume.forgetImage(second);
    EXPECT_EQ(order(), "1.1 1.3 ");
    EXPECT_EQ(slices(), "0/0 -1/0 1/0 ");
}

TEST_F(VolumeTest, ASeriesNumbersTheVolumesThatHaveNoIndexYet)
{
    TagMap series;
    series.addBareVolume(new Volume(0));
    series.addBareVolume(new Volume);
    series.addBareVolume(new Volume(7));
    EXPECT_EQ(series.volumes().at(0)->volumeIndex(), 0);
    EXPECT_EQ(series.volumes().at(1)->volumeIndex(), 2);
    EXPECT_EQ(series.volumes().at(2)->volumeIndex(), 7);
    const TagMap copy = series;
    TagMap(series).clearVolumes();
    EXPECT_TRUE(copy.volumes().at(1)->isBareVolume());
    series.clearVolumes();
    EXPECT_TRUE(series.volumes().isEmpty());
}

TEST_F(VolumeTest, ExtraDataNeedsASuffixAndAHistogramThatFits)
{
    EXPECT_FALSE(volume.hasExtraData());
    volume.setFileNameSuffix("series_2");
    EXPECT_TRUE(volume.hasExtraData());
    volume.setHistogram(Kdd::KxHistogram(QVector<quint64>(65535), 0, 1));
    EXPECT_TRUE(volume.hasExtraData());
    volume.setHistogram(Kdd::KxHistogram(QVector<quint64>(65536), 0, 1));
    EXPECT_FALSE(volume.hasExtraData());
    volume.setHistogram(Kdd::KxHistogram({0xFFFFFFFF}, 0, 1));
    EXPECT_TRUE(volume.hasExtraData());
    volume.setHistogram(Kdd::KxHistogram({0xFFFFFFFF, 1}, 0, 1));
    EXPECT_FALSE(volume.hasExtraData());
    volume.setHistogram(Kdd::KxHistogram({~quint64(0), 2}, 0, 1));
    EXPECT_FALSE(volume.hasExtraData());
}

struct NamedFile
{
    const char* file;
    const char* suffix;
};

TEST(VolumeFileName, HasASuffix)
{
    const NamedFile files[] = {
        {"x-y-z.dat", "y-z"},
        {"vol", "vol"},
        {"vol.1.dat", "vol"},
        {"ab-series_part007.vol", "series_7"},
        {"ab-series_part100.vol", "series_100"},
        {"series_part000", "series_"},
        {"a.b-c_part2x3", "c_2"},
        {"a_part1-b.vol", "b"},
        {"a-", ""},
        {"", ""},
        {nullptr, ""},
    };
    for (const NamedFile& each : files)
        EXPECT_EQ(Volume::fileNameSuffix(each.file), QByteArray(each.suffix)) << each.suffix;
}

TEST(SliceList, ARunIsRecognisedHoweverItWasMade)
{
    using Run = SliceList::Run;
    EXPECT_EQ(SliceList({{0, 0}, {1, 0}, {2, 0}}).run(), Run::Ascending);
    EXPECT_EQ(SliceList({{2, 0}, {1, 0}, {0, 0}}).run(), Run::Descending);
    EXPECT_EQ(SliceList({{0, 0}}).run(), Run::Ascending);
    EXPECT_EQ(SliceList({{0, 0}, {1, 1}}).run(), Run::None);
    EXPECT_EQ(SliceList({{1, 0}, {2, 0}}).run(), Run::None);
    EXPECT_EQ(SliceList::ofRun(Run::Descending, 0).run(), Run::None);
    EXPECT_EQ(SliceList::ofRun(Run::Descending, 3).at(0).image, 2);
}

}  // namespace
