#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"
#include "platform/base/KxMsg.h"

#include <boost/optional/optional_io.hpp>
#include <dcmtk/dcmdata/dcdeftag.h>
#include <gtest/gtest.h>

#include <random>
#include <set>
#include <sstream>

namespace
{

using Kdd::KxMsg;
using Kdd::Slice;
using Kdd::TagMap;
using Kdd::Volume;

using Blobs = QList<QByteArray>;
using Padding = boost::optional<qint32>;

const DcmTagKey kVolumeIndex(0x0006, 0x7103);

constexpr int kBeforeName = 2 + 12 + 24 + 64;
constexpr int kCodeOfUnnamed = kBeforeName + 2;

class OpenVolume : public Volume
{
public:
    using Volume::setImages;
    using Volume::setSlices;
    using Volume::Volume;
};

/// A series with images "1", "2", ... that name their volumes.
class Series
{
public:
    void addImage(const QByteArray& volumeIndexes, bool isSigned = false)
    {
        const int number = mNode.children().size() + 1;
        auto* image = new TagMap;
        image->putAndInsertString(DCM_SOPInstanceUID, QByteArray::number(number));
        image->putAndInsertInt(DCM_InstanceNumber, number);
        image->putAndInsertInt(DCM_PixelRepresentation, isSigned ? 1 : 0);
        if (!volumeIndexes.isEmpty())
            image->putAndInsertValue(kVolumeIndex, Kdd::VrCode::OB, volumeIndexes);
        mNode.addChildMap(image, TagMap::ImageLevel);
    }

    void add(const Volume& volume) { mNode.addBareVolume(new Volume(volume)); }

    /// The volume list as a tag file holds it.
    QByteArray written() const
    {
        KxMsg out;
        mBlobs.clear();
        mNode.serializeVolumes(out, mBlobs);
        return out.bytes();
    }

    bool read(const QByteArray& record)
    {
        mNode.clearVolumes();
        KxMsg in(record);
        const int length = TagMap::readLength(in);
        KxMsg list = in.readMessage(length);
        mNode.deserializeVolumes(list, mBlobs);
        return !list.failed();
    }

    TagMap& node() { return mNode; }
    const Volume& volume(int i) const { return *mNode.volumes().at(i); }

private:
    TagMap mNode;
    mutable Blobs mBlobs;
};

std::string images(const Volume& volume)
{
    std::string text;
    for (int i = 0; i < volume.numImages(); ++i) {
        QByteArray uid;
        volume.image(i)->findAndGetString(DCM_SOPInstanceUID, uid);
        text += uid.toStdString() + ' ';
    }
    return text;
}

/// All that a record keeps, without what the images give.
std::string describe(const Volume& volume)
{
    KxMsg geometry;
    Kdd::Box3f box;
    Kdd::Mat4f matrix;
    volume.getBoundingBox(box);
    volume.getTransformationMatrix(matrix);
    geometry << volume.dims() << box << matrix;
    std::ostringstream text;
    text << volume.volumeIndex() << ' ' << geometry.bytes().toHex().constData() << " file "
         << volume.volumeFileName().constData() << " preview " << volume.previewData().constData()
         << " slices";
    for (int i = 0; i < volume.slices().size(); ++i)
        text << ' ' << volume.slices().at(i).image << '/' << volume.slices().at(i).frame;
    text << " suffix " << volume.fileNameSuffix().constData();
    if (volume.fileNameSuffix().isEmpty())
        return text.str();
    text << ' ' << volume.rescaleSlope() << ' ' << volume.rescaleIntercept() << ' '
         << volume.precisionBitLoss() << " lossy " << volume.numLossyCompressedImages() << " overlays "
         << volume.numOverlayPlanes() << " padding " << volume.paddingValue() << ' '
         << volume.paddingRangeLimit() << " histogram " << volume.histogram().minimum() << ' '
         << volume.histogram().maximum();
    for (const quint64 bin : volume.histogram().bins())
        text << ' ' << bin;
    return text.str();
}

KxMsg bodyOf(const QByteArray& record)
{
    KxMsg in(record);
    const int length = TagMap::readLength(in);
    return KxMsg(in.read(length));
}

QByteArray record(const Volume& volume, Blobs& blobs)
{
    KxMsg out;
    volume.serialize(out, blobs);
    return out.bytes();
}

QByteArray record(const Volume& volume)
{
    Blobs blobs;
    return record(volume, blobs);
}

/// Chooses among the shapes that volumes have, the unlikely ones included.
class RandomVolumes
{
public:
    explicit RandomVolumes(unsigned seed)
        : mSource(seed)
    {
    }

    int below(int bound) { return static_cast<int>(mSource() % static_cast<unsigned>(bound)); }
    bool once(int in) { return below(in) == 0; }

    OpenVolume volume(TagMap* image)
    {
        OpenVolume made(3);
        const int count = once(8) ? 0 : 1 + below(9);
        made.setImages(QVector<TagMap*>(once(3) ? below(12) : count, image), nullptr);
        made.setSlices(slices(count));
        Kdd::Mat4f matrix;
        matrix.m[5] = real();
        made.setGeometry({once(6) ? 0 : 1 + below(512), below(512), once(5) ? below(12) : count},
                         {real(), real(), real(), real(), real(), real()}, matrix);
        made.setVolumeFileName(text());
        made.setPreviewData(text());
        if (!once(3))
            addExtraData(made);
        return made;
    }

private:
    float real() { return static_cast<float>(below(2000000)) / 7 - 100000; }
    QByteArray text() { return once(2) ? QByteArray() : QByteArray(1 + below(300), char('a' + below(26))); }

    QVector<Slice> slices(int count)
    {
        const int shape = below(5);
        const int widest = once(3) ? 70000 : 9;
        QVector<Slice> made;
        for (int i = 0; i < count; ++i) {
            if (shape < 2)
                made.append({shape == 0 ? i : count - 1 - i, 0});
            else
                made.append({below(widest) - (shape == 3 ? 1 : 0), shape == 2 ? 0 : below(widest)});
        }
        return made;
    }

    void addExtraData(Volume& volume)
    {
        volume.setFileNameSuffix(text());
        volume.setRescale(1 + real() * real(), real(), real());
        volume.setNumLossyCompressedImages(below(65536));
        volume.setNumOverlayPlanes(below(256));
        volume.setPadding(once(2) ? Padding() : below(65536), once(2) ? Padding() : below(65536));
        QVector<quint64> bins(below(40));
        for (quint64& bin : bins)
            bin = static_cast<quint64>(below(100000000));
        volume.setHistogram(Kdd::KxHistogram(bins, below(65536), below(65536)));
    }

    std::mt19937 mSource;
};

TEST(VolumeRecord, GivesBackEveryVolume)
{
    TagMap image;
    std::set<int> codes;
    for (unsigned seed = 0; seed < 3000; ++seed) {
        const OpenVolume volume = RandomVolumes(seed).volume(&image);
        Blobs blobs = {"preview of another"};
        const QByteArray bytes = record(volume, blobs);
        codes.insert(bytes.at(kCodeOfUnnamed + volume.volumeFileName().size()));
        KxMsg in = bodyOf(bytes);
        Volume again;
        ASSERT_TRUE(again.deserialize(in, blobs, 3)) << seed;
        ASSERT_EQ(in.remaining(), 0) << seed;
        ASSERT_EQ(describe(again), describe(volume)) << seed;
    }
    EXPECT_EQ(codes, (std::set<int>{1, 2, 3, 4, 5, 6}));
}

struct SliceCase
{
    const char* name;
    int numImages;
    QVector<Slice> slices;
    Kdd::Vec3i dims;
    char code;
    int bytes;
};

class SliceCode : public testing::TestWithParam<SliceCase>
{
};

TEST_P(SliceCode, IsTheShortestThatGivesBackTheSlices)
{
    TagMap image;
    OpenVolume volume(0);
    volume.setImages(QVector<TagMap*>(GetParam().numImages, &image), nullptr);
    volume.setSlices(GetParam().slices);
    volume.setGeometry(GetParam().dims, {}, {});
    const QByteArray bytes = record(volume);
    EXPECT_EQ(bytes.at(kCodeOfUnnamed), GetParam().code);
    EXPECT_EQ(bytes.size(), kCodeOfUnnamed + 1 + GetParam().bytes + 2);
    KxMsg in = bodyOf(bytes);
    Volume again;
    ASSERT_TRUE(again.deserialize(in, {}, 0));
    EXPECT_EQ(describe(again), describe(volume));
}

const SliceCase kSliceCases[] = {
    {"InOrder", 3, {{0, 0}, {1, 0}, {2, 0}}, {4, 4, 3}, 1, 0},
    {"OneSliceIsInOrder", 1, {{0, 0}}, {4, 4, 1}, 1, 0},
    {"Reversed", 3, {{2, 0}, {1, 0}, {0, 0}}, {4, 4, 3}, 2, 0},
    {"Mixed", 3, {{2, 0}, {0, 0}, {1, 0}}, {4, 4, 3}, 3, 6},
    {"InOrderWithoutColumns", 3, {{0, 0}, {1, 0}, {2, 0}}, {0, 4, 3}, 4, 16},
    {"ReversedInMoreSlicesThanListed", 2, {{1, 0}, {0, 0}}, {4, 4, 3}, 4, 12},
    {"MixedAndUnknown", 2, {{1, 0}, {-1, 0}}, {4, 4, 2}, 4, 12},
    {"MixedAndLarge", 2, {{1, 0}, {65536, 0}}, {4, 4, 2}, 4, 12},
    {"FramesOfOneImage", 1, {{0, 0}, {0, 1}, {0, 65535}}, {4, 4, 3}, 5, 12},
    {"InOrderOfMoreImages", 4, {{0, 0}, {1, 0}}, {4, 4, 2}, 5, 8},
    {"AFrameOfEachImage", 2, {{0, 0}, {1, 1}}, {4, 4, 2}, 5, 8},
    {"NoSlices", 2, {}, {4, 4, 0}, 5, 0},
    {"NothingKnown", 0, {}, {0, 0, 0}, 5, 0},
    {"NoSlicesListed", 0, {}, {4, 4, 3}, 6, 4},
    {"NoSlicesListedOrWithColumns", 0, {}, {0, 4, 3}, 6, 4},
    {"FramesWithoutColumns", 1, {{0, 0}, {0, 1}}, {0, 4, 2}, 6, 20},
    {"LargeFrame", 1, {{0, 0}, {0, 65536}}, {4, 4, 2}, 6, 20},
    {"UnknownImageOfFrames", 1, {{0, 0}, {-1, 1}}, {4, 4, 2}, 6, 20},
    {"NegativeSlices", 0, {}, {4, 4, -1}, 6, 4},
};
INSTANTIATE_TEST_SUITE_P(VolumeRecord, SliceCode, testing::ValuesIn(kSliceCases),
                         [](const auto& row) { return std::string(row.param.name); });

TEST(VolumeRecord, StacksTooLongForTheShortCodesComeBackToo)
{
    TagMap image;
    for (const int count : {65536, 1000001}) {
        OpenVolume inOrder(0);
        inOrder.setImages(QVector<TagMap*>(count, &image), nullptr);
        QVector<Slice> slices(count);
        for (int i = 0; i < count; ++i)
            slices[i].image = i;
        inOrder.setSlices(slices);
        inOrder.setGeometry({1, 1, count}, {}, {});
        OpenVolume frames = inOrder;
        frames.setSlices(QVector<Slice>(count, {0, 1}));
        for (const OpenVolume& volume : {inOrder, frames}) {
            KxMsg in = bodyOf(record(volume));
            Volume again;
            ASSERT_TRUE(again.deserialize(in, {}, 0)) << count;
            EXPECT_EQ(again.slices().size(), count);
            EXPECT_EQ(again.slices().at(count - 1).image, volume.slices().at(count - 1).image);
        }
    }
}

TEST(VolumeRecord, ExtraDataHasAFixedLayout)
{
    Volume volume(0);
    volume.setFileNameSuffix("s_2");
    volume.setRescale(1, -2, 0.5F);
    volume.setNumLossyCompressedImages(0x0102);
    volume.setPadding(-2, boost::none);
    volume.setHistogram(Kdd::KxHistogram({1, 0x01020304}, 0.5, 254.4));
    volume.setNumOverlayPlanes(9);
    const QByteArray extra = record(volume).mid(kCodeOfUnnamed + 3);
    EXPECT_EQ(extra.toHex().toStdString(),
              "00"          // version
              "0300735f32"  // suffix
              "0000803f000000c00000003f"
              "0201"  // lossy images
              "01feff"
              "00"  // padding
              "0100fe00"
              "0200"
              "01000000"
              "04030201"
              "09");
}

TEST(VolumeRecord, NumbersBeyondTheirFieldAreHeldAtItsLimit)
{
    Volume volume(0);
    volume.setFileNameSuffix("s");
    volume.setNumLossyCompressedImages(70000);
    volume.setNumOverlayPlanes(300);
    volume.setHistogram(Kdd::KxHistogram({1}, -1024, 1e30));
    KxMsg in = bodyOf(record(volume));
    ASSERT_TRUE(volume.deserialize(in, {}, 0));
    EXPECT_EQ(volume.numLossyCompressedImages(), 65535);
    EXPECT_EQ(volume.numOverlayPlanes(), 255);
    EXPECT_EQ(volume.histogram().minimum(), 0);
    EXPECT_EQ(volume.histogram().maximum(), 65535);
}

TEST(VolumeRecord, ExtraDataOfAnotherVersionIsPassedOver)
{
    Volume volume(0);
    volume.setFileNameSuffix("s");
    QByteArray bytes = record(volume);
    bytes[kCodeOfUnnamed + 3] = 1;
    KxMsg in = bodyOf(bytes);
    ASSERT_TRUE(volume.deserialize(in, {}, 0));
    EXPECT_EQ(volume.fileNameSuffix(), "");
}

TEST(VolumeRecord, APreviewOutsideTheTableIsNone)
{
    Volume volume(0);
    volume.setPreviewData("jpeg");
    Blobs blobs = {"other"};
    const QByteArray bytes = record(volume, blobs);
    EXPECT_EQ(blobs, (Blobs{"other", "jpeg"}));
    for (const Blobs& table : {blobs, Blobs{"other"}, Blobs()}) {
        KxMsg in = bodyOf(bytes);
        ASSERT_TRUE(volume.deserialize(in, table, 0));
        EXPECT_EQ(volume.hasPreview(), table.size() == 2);
    }
}

/// A record up to the slice list code.
KxMsg head(const Kdd::Vec3i& dims)
{
    KxMsg out;
    out << dims << Kdd::Box3f() << Kdd::Mat4f() << quint16(0);
    return out;
}

KxMsg withSlices(const Kdd::Vec3i& dims, quint8 code, const QByteArray& list = {})
{
    KxMsg out = head(dims);
    out << code;
    out.write(list);
    out << quint16(0);
    return out;
}

QByteArray int32(qint32 value)
{
    return (KxMsg() << value).bytes();
}

TEST(VolumeRecord, WhatTheSliceCountsClaimIsHeldAgainstWhatIsThere)
{
    const KxMsg damaged[] = {
        withSlices({1, 1, 0x7FFFFFFF}, 1),
        withSlices({1, 1, 1000001}, 2),
        withSlices({1, 1, -1}, 1),
        withSlices({1, 1, -1}, 3),
        withSlices({1, 1, 4}, 3, int32(0)),
        withSlices({1, 1, 0x7FFFFFFF}, 5, int32(0)),
        withSlices({1, 1, 0}, 4, int32(0x7FFFFFFF)),
        withSlices({1, 1, 0}, 4, int32(-1)),
        withSlices({1, 1, 0}, 6, int32(1) + int32(0)),
        withSlices({1, 1, 0}, 6, int32(0x20000000) + int32(0)),
        withSlices({1, 1, 0}, 0),
        withSlices({1, 1, 0}, 7),
    };
    for (const KxMsg& each : damaged) {
        KxMsg in = each;
        Volume volume(5);
        volume.setFileNameSuffix("before");
        EXPECT_FALSE(volume.deserialize(in, {}, 0)) << each.bytes().mid(8).toHex().toStdString();
        EXPECT_TRUE(in.failed());
        EXPECT_EQ(volume.volumeIndex(), 5);
        EXPECT_EQ(volume.fileNameSuffix(), "before");
    }
    KxMsg longest = withSlices({1, 1, 1000000}, 2);
    Volume volume;
    ASSERT_TRUE(volume.deserialize(longest, {}, 0));
    EXPECT_EQ(volume.slices().at(0).image, 999999);
}

TEST(VolumeList, ACountOfVolumesIsHeldAgainstWhatIsThere)
{
    for (const qint32 count : {2, 65534, 0x7FFFFFFF, -1}) {
        KxMsg list;
        list << quint16(65535) << count;
        list.write(record(Volume(0)));
        TagMap series;
        series.deserializeVolumes(list, {});
        EXPECT_TRUE(list.failed()) << count;
        EXPECT_TRUE(series.volumes().isEmpty());
    }
}

OpenVolume aStack(int slices)
{
    OpenVolume volume;
    QVector<Slice> entries(slices);
    volume.setSlices(entries);
    volume.setGeometry({8, 8, slices}, {}, {});
    return volume;
}

TEST(VolumeList, ImagesAreThoseThatNameTheVolume)
{
    Series series;
    for (const char* indexes : {"\x02", "", "\x02\x01\x02", "\x02"})
        series.addImage(indexes);
    series.addImage(QByteArray("\0\x02", 2));
    for (int i = 0; i < 3; ++i)
        series.add(aStack(1));
    ASSERT_TRUE(series.read(series.written()));
    EXPECT_EQ(images(series.volume(0)), "5 ");
    EXPECT_EQ(images(series.volume(1)), "3 ");
    EXPECT_EQ(images(series.volume(2)), "1 3 4 5 ");
    for (int i = 0; i < 3; ++i)
        EXPECT_EQ(series.volume(i).volumeIndex(), i);
}

TEST(VolumeList, ImagesInheritTheIndexAndMayHoldItAsANumber)
{
    Series series;
    for (int i = 0; i < 3; ++i)
        series.addImage(QByteArray(1, '\0'));
    series.node().optimizeAll();
    ASSERT_TRUE(series.node().tagsForLevel().contains(kVolumeIndex));
    for (int i = 0; i <= 300; ++i)
        series.add(aStack(1));
    series.node().children().at(1)->putAndInsertInt(kVolumeIndex, 300);
    ASSERT_TRUE(series.read(series.written()));
    EXPECT_EQ(images(series.volume(0)), "1 3 ");
    EXPECT_EQ(images(series.volume(44)), "");
    EXPECT_EQ(images(series.volume(300)), "2 ");
}

TEST(VolumeList, IndexesWithGapsBelongToTheVolumesWithSlices)
{
    Series series;
    for (const char* index : {"\x01", "\x04"})
        series.addImage(index);
    series.add(aStack(1));
    series.add(Volume());
    series.add(aStack(1));
    ASSERT_TRUE(series.read(series.written()));
    EXPECT_EQ(images(series.volume(0)), "1 ");
    EXPECT_EQ(images(series.volume(1)), "");
    EXPECT_EQ(images(series.volume(2)), "2 ");
    EXPECT_EQ(series.volume(0).volumeIndex(), 1);
    EXPECT_EQ(series.volume(2).volumeIndex(), 4);
}

TEST(VolumeList, ImagesAreSortedAsAVolumeSortsThem)
{
    Series series;
    for (int i = 0; i < 3; ++i)
        series.addImage(QByteArray(1, '\0'));
    series.node().children().at(0)->putAndInsertInt(DCM_InstanceNumber, 9);
    series.add(aStack(3));
    ASSERT_TRUE(series.read(series.written()));
    EXPECT_EQ(images(series.volume(0)), "2 3 1 ");
}

TEST(VolumeList, PaddingHasTheSignOfTheImages)
{
    for (const bool isSigned : {false, true}) {
        Series series;
        series.addImage(QByteArray(1, '\0'), isSigned);
        OpenVolume volume = aStack(1);
        volume.setFileNameSuffix("s");
        volume.setPadding(isSigned ? -2000 : 63536, isSigned ? -1 : 65535);
        series.add(volume);
        ASSERT_TRUE(series.read(series.written()));
        EXPECT_EQ(series.volume(0).paddingValue(), volume.paddingValue());
        EXPECT_EQ(series.volume(0).paddingRangeLimit(), volume.paddingRangeLimit());
    }
}

TEST(VolumeList, ASecondListOfASeriesIsRefused)
{
    Series series;
    series.add(aStack(1));
    const QByteArray bytes = series.written();
    ASSERT_TRUE(series.read(bytes));
    KxMsg second = bodyOf(bytes);
    series.node().deserializeVolumes(second, {});
    EXPECT_TRUE(second.failed());
    EXPECT_EQ(series.node().volumes().size(), 1);
}

TEST(VolumeList, ImagesThatAreInHundredsOfVolumesAreHeldAgainstABound)
{
    QByteArray all(1 << 20, '\0');
    for (int i = 0; i < 256; ++i)
        all[i] = static_cast<char>(i);
    for (const int images : {3906, 3907}) {  // 256 * 3907 is the first above a million
        Series series;
        for (int i = 0; i < images; ++i)
            series.addImage({});
        series.node().putAndInsertValue(kVolumeIndex, Kdd::VrCode::OB, all);
        series.add(aStack(1));
        EXPECT_EQ(series.read(series.written()), images == 3906);
    }
}

/// Volumes of every slice code, with images, previews and extra data.
void fill(Series& series)
{
    const QVector<Slice> lists[] = {{{0, 0}, {1, 0}, {2, 0}}, {{2, 0}, {1, 0}, {0, 0}},
                                    {{1, 0}, {0, 0}, {2, 0}}, {{1, 0}, {-1, 0}, {2, 0}},
                                    {{1, 0}, {1, 1}, {2, 0}}, {{1, 0}, {1, 70000}, {2, 0}}};
    for (const char* indexes : {"\x02\x03\x04", "\x01\x02\x03\x04\x05", "\x01\x03"})
        series.addImage(indexes, true);
    TagMap image;
    for (const QVector<Slice>& list : lists) {
        OpenVolume volume = aStack(3);
        volume.setImages({&image, &image, &image}, nullptr);
        volume.setSlices(list);
        volume.setVolumeFileName("v");
        volume.setPreviewData("jpeg");
        volume.setFileNameSuffix("s");
        volume.setPadding(-5, 7);
        volume.setHistogram(Kdd::KxHistogram({1, 2}, 0, 9));
        series.add(volume);
    }
}

/// False when the list is refused; every volume of a list that is not must be usable.
bool readAndUse(Series& series, const QByteArray& list)
{
    if (!series.read(list))
        return false;
    for (const Volume* volume : series.node().volumes()) {
        int frame = 0;
        volume->imageForSlice(volume->slices().size() / 2, frame);
        volume->precisionBitLoss();
        EXPECT_EQ(volume->volumeHash().size(), 32);
    }
    return true;
}

TEST(VolumeList, EveryTruncationIsRefused)
{
    Series series;
    fill(series);
    const QByteArray whole = series.written();
    ASSERT_TRUE(readAndUse(series, whole));
    for (int size = 0; size < whole.size(); ++size)
        EXPECT_FALSE(readAndUse(series, whole.left(size))) << size;
}

TEST(VolumeList, ATruncatedVolumeIsRefusedOrHasNoExtraData)
{
    Series series;
    fill(series);
    for (const Volume* volume : series.node().volumes()) {
        const QByteArray whole = bodyOf(record(*volume)).bytes();
        for (int size = 0; size < whole.size(); ++size) {
            KxMsg in(whole.left(size));
            Volume again;
            EXPECT_TRUE(!again.deserialize(in, {}, 0) || again.fileNameSuffix().isEmpty()) << size;
        }
    }
}

TEST(VolumeList, ADamagedByteIsRefusedOrGivesVolumesThatCanBeUsed)
{
    Series series;
    fill(series);
    const QByteArray whole = series.written();
    int numRefused = 0;
    for (int at = 0; at < whole.size(); ++at) {
        for (const int flip : {0x01, 0x04, 0x40, 0x80, 0xFF}) {
            QByteArray damaged = whole;
            damaged[at] = static_cast<char>(whole.at(at) ^ flip);
            numRefused += readAndUse(series, damaged) ? 0 : 1;
        }
    }
    EXPECT_GT(numRefused, 0);
}

}  // namespace
