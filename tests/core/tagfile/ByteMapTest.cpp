#include "kddlib/tagfile/ByteMap.h"

#include "TagFileFixture.h"
#include "support/ObjectServer.h"

using namespace Kdd;

namespace
{

using Part = ByteMap::Part;
using Path = QVector<DcmTagKey>;

class ByteMapTest : public TagFileTest
{
protected:
    /// Three images with previews, items and a volume. Two texts of each image are the same, and no other image's.
    static void fill(TagFile& file)
    {
        for (const char* uid : {"1", "2", "3"}) {
            DatasetBuilder image = anImage(uid).with(DCM_PatientComments, noise(*uid));
            image.with(DCM_ImageComments, noise(*uid));
            image.withItem(DCM_RequestAttributesSequence, anItem().with(DCM_CodeValue, uid));
            add(file, image)->putAndInsertValue(kPreview, VrCode::OB, QByteArray(uid) + "jpeg");
        }
        auto* volume = new Volume;
        volume->setPreviewData("the volume's jpeg");
        file.findSeries("1.2.3")->addBareVolume(volume);
    }

    static QByteArray noise(char seed) { return someObject(200 + seed).toHex().left(400); }

    static ByteMap::Cost sumOf(const ByteMap& map)
    {
        ByteMap::Cost sum;
        for (const ByteMap::Entry& entry : map.entries()) {
            sum.before += entry.cost.before;
            sum.after += entry.cost.after;
        }
        return sum;
    }

    static ByteMap::Cost costOf(const ByteMap& map, Part part)
    {
        return map.entries().at(static_cast<int>(part)).cost;
    }

    /// On whatever level it stands.
    static ByteMap::Cost costOf(const ByteMap& map, const Path& path)
    {
        ByteMap::Cost sum;
        for (const ByteMap::Entry& entry : map.entries()) {
            if (entry.path == path)
                sum = {sum.entries + entry.cost.entries, sum.before + entry.cost.before,
                       sum.after + entry.cost.after};
        }
        return sum;
    }
};

TEST_F(ByteMapTest, GivesEveryByteToWhatItIsSpentFor)
{
    TagFile file;
    fill(file);
    for (const Mode mode : kModes) {
        const QByteArray content = written(file, mode);
        ByteMap map;
        ASSERT_TRUE(map.add(content + "left").good());
        EXPECT_EQ(sumOf(map).after, content.size() + 4);
        EXPECT_EQ(sumOf(map).before, file.statistics().uncompressedSize + 4);
        EXPECT_EQ(costOf(map, Part::LeftOver).after, 4);
        EXPECT_EQ(costOf(map, Part::ImagePreviews).entries, 3);
        EXPECT_EQ(costOf(map, Part::ImagePreviews).after, 3 * (4 + 5));
        EXPECT_EQ(costOf(map, Part::VolumePreviews).after, 4 + 17);
        EXPECT_EQ(costOf(map, Part::Volumes).entries, 1);
        const ByteMap::Cost item = costOf(map, {DCM_RequestAttributesSequence, DCM_CodeValue});
        for (const ByteMap::Cost& cost : {costOf(map, {DCM_SOPInstanceUID}), item}) {
            EXPECT_EQ(cost.entries, 3);
            EXPECT_EQ(cost.before, 3 * (7 + 1));
        }
        // Random hexadecimal digits have 4 bits each, and some more until LZMA has learnt that; to say them again costs
        // next to nothing.
        const ByteMap::Cost first = costOf(map, {DCM_PatientComments});
        const ByteMap::Cost again = costOf(map, {DCM_ImageComments});
        EXPECT_EQ(first.before, again.before);
        EXPECT_NEAR(double(first.after), mode == Mode::None ? 3 * 407 : 680, 70);
        EXPECT_NEAR(double(again.after), mode == Mode::None ? 3 * 407 : 36, 36);
    }
}

TEST_F(ByteMapTest, AddsUpFilesAndReadsThemWhereTheyLie)
{
    TagFile file;
    fill(file);
    ASSERT_TRUE(file.writeCacheFile());
    ByteMap map;
    EXPECT_TRUE(map.addFile(path(), "1.2").good());
    EXPECT_TRUE(map.addFile(path(), nullptr).good());
    const ByteMap::Cost sum = sumOf(map);
    EXPECT_EQ(sum.after, 2 * content().size());
    EXPECT_TRUE(map.addFile(path(), "1.3").bad());
    EXPECT_TRUE(map.addFile(path() + QLatin1Char('x'), nullptr).bad());
    EXPECT_EQ(map.files(), 2);
    EXPECT_EQ(sumOf(map).after, sum.after);
    // The old layout has neither a size nor previews.
    const QByteArray whole = written(file);
    ByteMap old;
    ASSERT_TRUE(old.add(QByteArray("TaCa\0\0\1\0", 8) + whole.mid(kHeaderSize, bodySize(whole))).good());
    EXPECT_EQ(sumOf(old).after, 8 + bodySize(whole));
    EXPECT_EQ(costOf(old, Part::Frame).after, 8);
}

TEST_F(ByteMapTest, RefusesWhatAReaderRefusesAndLosesNoByteOfTheRest)
{
    TagFile file;
    add(file, anImage("1").withItem(DCM_RequestAttributesSequence, anItem().with(DCM_CodeValue, "1")))
        ->putAndInsertValue(kPreview, VrCode::OB, "jpeg");
    const LogCapture log;
    const QByteArray whole = written(file);
    const auto check = [](const QByteArray& content) {
        ByteMap map;
        TagFile reader;
        const bool isAdded = map.add(content).good();
        EXPECT_TRUE(isAdded || sumOf(map).after == 0);
        EXPECT_TRUE(!isAdded || sumOf(map).after == content.size());
        EXPECT_TRUE(!isAdded || read(reader, content));
    };
    for (int at = 0; at < whole.size(); ++at) {
        check(whole.left(at));
        for (const int flip : {0x01, 0x80, 0xFF}) {
            QByteArray damaged = whole;
            damaged[at] = static_cast<char>(whole.at(at) ^ flip);
            check(damaged);
        }
    }
}

}  // namespace
