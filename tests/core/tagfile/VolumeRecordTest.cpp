#include "kddlib/Limits.h"
#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"
#include "platform/base/KxMsg.h"

#include <boost/optional/optional_io.hpp>
#include <dcmtk/dcmdata/dcdeftag.h>
#include <gtest/gtest.h>

#include <random>
#include <set>

using namespace Kdd;

namespace
{

using Blobs = QList<QByteArray>;

constexpr int kBeforeCode = 12 + 24 + 64 + 2;

class OpenVolume : public Volume
{
public:
    using Volume::setImages;
    using Volume::setSlices;
    using Volume::Volume;
};

/// A series with images "1", "2", ... that name their volumes.
struct Series
{
    void addImage(const QByteArray& volumeIndexes, bool isSigned = false)
    {
        const int number = node.children().size() + 1;
        auto* image = new TagMap;
        image->putAndInsertString(DCM_SOPInstanceUID, QByteArray::number(number));
        image->putAndInsertInt(DCM_InstanceNumber, number);
        image->putAndInsertInt(DCM_PixelRepresentation, isSigned ? 1 : 0);
        image->putAndInsertValue(kVolumeIndex, VrCode::OB, volumeIndexes);
        node.addChildMap(image, TagMap::ImageLevel);
    }

    Volume& addStack()
    {
        auto* volume = new Volume;
        volume->setGeometry({8, 8, 1}, {}, {});
        node.addBareVolume(volume);
        return *volume;
    }

    QByteArray written()
    {
        KxMsg out;
        node.serializeVolumes(out, blobs);
        return out.bytes();
    }

    bool read(const QByteArray& record)
    {
        node.clearVolumes();
        KxMsg in(record);
        const int length = TagMap::readLength(in);
        KxMsg list = in.readMessage(length);
        node.deserializeVolumes(list, blobs);
        return !list.failed();
    }

    std::string images(int volume) const
    {
        std::string text;
        const Volume& wanted = *node.volumes().at(volume);
        for (int i = 0; i < wanted.numImages(); ++i)
            text += std::to_string(node.children().indexOf(wanted.image(i)) + 1) + ' ';
        return text;
    }

    TagMap node;
    Blobs blobs;
};

/// All that a record keeps, without what the images give.
QByteArray describe(const Volume& v)
{
    KxMsg out;
    Box3f box;
    Mat4f matrix;
    v.getBoundingBox(box);
    v.getTransformationMatrix(matrix);
    out << v.volumeIndex() << v.dims() << box << matrix << v.slices().size();
    for (int i = 0; i < v.slices().size(); ++i)
        out << v.slices().at(i).image << v.slices().at(i).frame;
    out.write(v.volumeFileName() + '|' + v.previewData() + '|' + v.fileNameSuffix());
    if (v.fileNameSuffix().isEmpty())
        return out.bytes();
    const KxHistogram& histogram = v.histogram();
    out << v.rescaleSlope() << v.rescaleIntercept() << v.precisionBitLoss() << v.numLossyCompressedImages()
        << v.numOverlayPlanes() << v.paddingValue().value_or(-1) << v.paddingRangeLimit().value_or(-1)
        << float(histogram.minimum()) << float(histogram.maximum());
    for (const quint64 bin : histogram.bins())
        out << static_cast<quint32>(bin);
    return out.bytes();
}

QByteArray body(const Volume& volume)
{
    Blobs previews = {"of another"};
    KxMsg record;
    volume.serialize(record, previews);
    KxMsg in(record.bytes());
    const int length = TagMap::readLength(in);
    return in.read(length);
}

int codeOf(const Volume& volume)
{
    return body(volume).at(kBeforeCode + volume.volumeFileName().size());
}

/// Chooses among the shapes that volumes have, the unlikely ones included.
struct RandomVolumes
{
    int below(int bound) { return static_cast<int>(source() % static_cast<unsigned>(bound)); }
    bool once(int in) { return below(in) == 0; }
    float real() { return static_cast<float>(below(2000000)) / 7 - 100000; }
    QByteArray text() { return once(2) ? QByteArray() : QByteArray(1 + below(300), char('a' + below(26))); }
    boost::optional<qint32> padding() { return boost::make_optional(once(2), below(65536)); }

    Slice slice(int ascending, int descending, int shape, int widest)
    {
        if (shape < 2)
            return {shape == 0 ? ascending : descending, 0};
        return {below(widest) - (shape == 3 ? 1 : 0), shape == 2 ? 0 : below(widest)};
    }

    OpenVolume volume(TagMap* image)
    {
        OpenVolume made(3);
        const int shape = below(5);
        const int widest = once(3) ? 70000 : 9;
        QVector<Slice> slices(once(8) ? 0 : 1 + below(9));
        const int count = slices.size();
        for (int i = 0; i < count; ++i)
            slices[i] = slice(i, count - 1 - i, shape, widest);
        made.setSlices(slices);
        made.setImages(QVector<TagMap*>(once(3) ? below(12) : count, image), nullptr);
        Mat4f matrix;
        matrix.m[5] = real();
        made.setGeometry({once(6) ? 0 : 1 + below(512), below(512), once(5) ? below(12) : count},
                         {real(), real(), real(), real(), real(), real()}, matrix);
        made.setVolumeFileName(text());
        made.setPreviewData(text());
        made.setFileNameSuffix(text());
        made.setRescale(1 + real() * real(), real(), real());
        made.setNumLossyCompressedImages(below(65536));
        made.setNumOverlayPlanes(below(256));
        made.setPadding(padding(), padding());
        const QVector<quint64> bins = {quint64(below(100000000)), quint64(below(100000000))};
        made.setHistogram(KxHistogram(bins.mid(below(3)), below(65536), below(65536)));
        return made;
    }

    std::mt19937 source;
};

TEST(VolumeRecord, GivesBackEveryVolume)
{
    TagMap image;
    std::set<int> codes;
    for (unsigned seed = 0; seed < 3000; ++seed) {
        const OpenVolume volume = RandomVolumes{std::mt19937(seed)}.volume(&image);
        KxMsg in(body(volume));
        codes.insert(codeOf(volume));
        Volume again;
        ASSERT_TRUE(again.deserialize(in, {"of another", volume.previewData()}, 3)) << seed;
        ASSERT_EQ(in.remaining(), 0) << seed;
        ASSERT_EQ(describe(again), describe(volume)) << seed;
    }
    EXPECT_EQ(codes, (std::set<int>{1, 2, 3, 4, 5, 6}));
}

TEST(VolumeRecord, WhatTheSliceCountsClaimIsHeldAgainstWhatIsThere)
{
    const QVector<qint32> rows[] = {
        {0x7FFFFFFF, 1},
        {1000001, 2},
        {-1, 1},
        {-1, 3},
        {4, 3, 0},
        {0x7FFFFFFF, 5, 0},
        {0, 4, 0x7FFFFFFF},
        {0, 4, -1},
        {0, 6, 1, 0},
        {0, 6, 0x20000000, 0},
        {0, 0},
        {0, 7},
    };
    Volume volume(5);
    volume.setFileNameSuffix("before");
    const QByteArray before = describe(volume);
    for (const QVector<qint32>& row : rows) {  // slices, code, list
        KxMsg in;
        in << Vec3i{1, 1, row[0]} << Box3f() << Mat4f() << quint16(0) << quint8(row[1]);
        for (const qint32 value : row.mid(2))
            in << value;
        in << quint16(0);
        EXPECT_FALSE(volume.deserialize(in, {}, 0)) << row[0] << " in code " << row[1];
        EXPECT_TRUE(in.failed());
        EXPECT_EQ(describe(volume), before);
    }
}

TEST(VolumeList, NamesNoMoreImagesThanItsReaderTakes)
{
    Series empty;
    empty.addStack();
    QByteArray indexes;
    for (int i = 0; i < 256; ++i)
        indexes.append(char(i));
    for (const int tooMany : {0, 1}) {
        Series series;
        for (int i = 0; i < kMaxVolumeImages / 256 + tooMany; ++i)
            series.node.addChildMap(new TagMap, TagMap::ItemLevel);
        series.node.putAndInsertValue(kVolumeIndex, VrCode::OB, indexes);
        series.addStack();
        EXPECT_EQ(series.written().isEmpty(), tooMany == 1);
        EXPECT_EQ(series.read(empty.written()), tooMany == 0);
    }
}

TEST(VolumeList, ImagesInheritTheIndexAndTheSignThatThePaddingHas)
{
    for (const bool isSigned : {false, true}) {
        Series series;
        for (int i = 0; i < 3; ++i)
            series.addImage(QByteArray(1, '\0'), isSigned);
        series.node.optimizeAll();
        ASSERT_TRUE(series.node.tagsForLevel().contains(kVolumeIndex));
        Volume& volume = series.addStack();
        volume.setFileNameSuffix("s");
        volume.setPadding(isSigned ? -2000 : 63536, isSigned ? -1 : 65535);
        ASSERT_TRUE(series.read(series.written()));
        EXPECT_EQ(series.images(0), "1 2 3 ");
        EXPECT_EQ(series.node.volumes().at(0)->paddingValue(), isSigned ? -2000 : 63536);
        EXPECT_EQ(series.node.volumes().at(0)->paddingRangeLimit(), isSigned ? -1 : 65535);
    }
}

TEST(VolumeList, ADamagedByteIsRefusedOrGivesVolumesThatCanBeUsed)
{
    Series series;
    for (const char* indexes : {"\x02\x03\x04", "\x01\x02\x03\x04\x05", "\x01\x03"})
        series.addImage(indexes, true);
    std::set<int> codes;
    for (unsigned seed = 0; codes.size() < 6; ++seed) {
        const OpenVolume volume = RandomVolumes{std::mt19937(seed)}.volume(series.node.children().at(0));
        const bool isFull = volume.hasPreview() && !volume.fileNameSuffix().isEmpty();
        if (isFull && codes.insert(codeOf(volume)).second)
            series.node.addBareVolume(new Volume(volume));
    }
    const QByteArray whole = series.written();
    ASSERT_TRUE(series.read(whole));
    int numRefused = 0;
    for (int at = 0; at < whole.size(); ++at) {
        EXPECT_FALSE(series.read(whole.left(at))) << at;
        for (const int flip : {0x01, 0x04, 0x40, 0x80, 0xFF}) {
            QByteArray damaged = whole;
            damaged[at] = static_cast<char>(whole.at(at) ^ flip);
            numRefused += series.read(damaged) ? 0 : 1;
            for (const Volume* volume : series.node.volumes()) {
                int frame = 0;
                volume->imageForSlice(volume->slices().size() / 2, frame);
                volume->precisionBitLoss();
                EXPECT_EQ(volume->volumeHash().size(), 32);
            }
        }
    }
    EXPECT_GT(numRefused, 0);
}

TEST(VolumeRecord, ExtraDataHasAFixedLayout)
{
    Volume volume(0);
    volume.setFileNameSuffix("s_2");
    volume.setRescale(1, -2, 0.5F);
    volume.setNumLossyCompressedImages(0x0102);
    volume.setPadding(-2, boost::none);
    volume.setHistogram(KxHistogram({1, 0x01020304}, 0.5, 254.4));
    volume.setNumOverlayPlanes(9);
    EXPECT_EQ(body(volume).mid(kBeforeCode + 3).toHex(), "00"          // version
                                                         "0300735f32"  // suffix
                                                         "0000803f000000c00000003f"
                                                         "0201"    // lossily compressed images
                                                         "01feff"  // padding value
                                                         "00"
                                                         "0100fe000200"  // minimum, maximum, bins
                                                         "0100000004030201"
                                                         "09");
}

}  // namespace
