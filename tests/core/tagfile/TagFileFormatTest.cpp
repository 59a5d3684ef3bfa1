#include "TagFileFixture.h"
#include "kddlib/Limits.h"
#include "kddlib/tagmodel/TagSequence.h"
#include "platform/base/KxMsg.h"

using namespace Kdd;

namespace
{

const QByteArray kPreviewElement = QByteArray::fromHex("06000671090100");  // up to its value of one character

class TagFileFormat : public TagFileTest
{
protected:
    static QByteArray bodyOf(TagFile& file)
    {
        const QByteArray content = written(file);
        return content.mid(kHeaderSize, bodySize(content));
    }

    /// Two images with previews.
    static QByteArray writtenWithPreviews()
    {
        TagFile file;
        add(file, anImage("1"))->putAndInsertValue(kPreview, VrCode::OB, "first jpeg");
        add(file, anImage("2"))->putAndInsertValue(kPreview, VrCode::OB, "second jpeg");
        return written(file);
    }

    static QByteArray previewOf(const TagFile& file, const char* uid)
    {
        EXPECT_EQ(file.findImage(uid)->findElement(kPreviewIndex), nullptr);
        const TagElement* preview = file.findImage(uid)->findElement(kPreview);
        EXPECT_TRUE(preview == nullptr || preview->vr() == VrCode::OB);
        return preview != nullptr ? preview->value() : QByteArray("none");
    }
};

TEST_F(TagFileFormat, IsFixedToTheByte)
{
    TagFile file;
    TagMap* image = add(file, anImage("1.2.3.1").without(DCM_SOPClassUID));
    for (const DcmTagKey& key : {kFilePath, kFileSuffix, kTransferSyntax, kVolumeIndex})
        image->putAndInsertInt(key, 0);
    for (const DcmTagKey& key : {kFromDatabase, kHasVolumeFile, kAbstract})
        file.study()->putAndInsertInt(key, 1);
    const QByteArray expected =
        QByteArray::fromHex("54614361 00 00 02 00"
                            "00000065"
                            "00 2200 06000771 0c 0100 01 06000871 0c 0100 01 06002071 0c 0100 01"
                            "20000d00 16 0300 312e32"
                            "01 0c00 20000e00 16 0500 312e322e33"
                            "02 2e00 06000071 0c 0100 00 06000171 0c 0100 00 06000271 0c 0100 00"
                            "06000371 0c 0100 00 08001800 16 0700 312e322e332e31"
                            "00000000");
    EXPECT_EQ(written(file).toHex(), expected.toHex());
}

TEST_F(TagFileFormat, EveryCompressionIsReadWhateverIsSet)
{
    TagFile file;
    fill(file);
    for (const Mode mode : kModes) {
        const QByteArray content = written(file, mode);
        EXPECT_EQ(content.at(7), static_cast<char>(mode));
        for (const Mode present : kModes) {
            TagFile::setCompressionMode(present);
            TagFile again;
            ASSERT_TRUE(read(again, content));
            EXPECT_EQ(treeText(again), treeText(file));
            EXPECT_EQ(again.findSeries("1.2.3")->volumes().at(0)->previewData(), "the volume's jpeg");
            EXPECT_EQ(written(again, mode).toHex(), content.toHex());
        }
    }
}

TEST_F(TagFileFormat, TheOldLayoutRunsToTheEndAndHasNoPreviews)
{
    TagFile file;
    TagMap* image = add(file, anImage("1"));
    image->putAndInsertValue(kPreview, VrCode::OB, "jpeg");
    image->putAndInsertValue(DCM_PixelData, VrCode::OB, QByteArray(600000, 'x'));  // read in several pieces
    TagFile again;
    ASSERT_TRUE(read(again, QByteArray("TaCa\0\0\1\0", 8) + bodyOf(file)));
    EXPECT_EQ(previewOf(again, "1"), "none");
    image->deleteElement(kPreview);
    EXPECT_EQ(imagesText(again), imagesText(file));
}

TEST_F(TagFileFormat, PreviewsStandBehindTheBodyAndOneThatIsNotThereIsDropped)
{
    const QByteArray content = writtenWithPreviews();
    EXPECT_EQ(content.mid(kHeaderSize + bodySize(content)),
              QByteArray::fromHex("00000002 0000000a") + "first jpeg" + QByteArray::fromHex("0000000b") +
                  "second jpeg");
    const LogCapture log;
    std::vector<QByteArray> damaged;
    for (const char number : {'2', '9', '-', 'x', '\0'})
        damaged.push_back(QByteArray(content).replace(kPreviewElement + '1', kPreviewElement + number));
    for (const int lost : {1, 11, 13, 15})
        damaged.push_back(content.chopped(lost));
    damaged.push_back(content);
    for (const QByteArray& each : damaged) {
        TagFile file;
        ASSERT_TRUE(read(file, each));
        EXPECT_EQ(previewOf(file, "1"), "first jpeg");
        EXPECT_EQ(previewOf(file, "2"), each == content ? "second jpeg" : "none");
    }
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(TagFileFormat, LengthsFrom65535OnTakeSixBytes)
{
    const std::pair<int, const char*> codes[] = {
        {0, "0000"}, {65534, "feff"}, {65535, "ffffffff0000"}, {65536, "ffff00000100"}};
    for (const auto& [length, hex] : codes) {
        KxMsg message;
        TagMap::writeLength(message, length);
        EXPECT_EQ(message.bytes().toHex(), hex);
        EXPECT_EQ(TagMap::readLength(message), length);
        EXPECT_TRUE(message.remaining() == 0 && !message.failed());
    }
}

TEST_F(TagFileFormat, OnlyTheStudyAskedForIsRead)
{
    TagFile one;
    add(one, anImage("1").inStudy("1.2").inSeries("s"));
    TagFile other;
    add(other, anImage("2").inStudy("1.2.0").inSeries("s"));
    const QByteArray both = framed(bodyOf(one) + bodyOf(other));
    TagFile file;
    ASSERT_TRUE(read(file, both, nullptr));
    EXPECT_EQ(treeText(file), treeText(one)) << "the first without a wish";
    ASSERT_TRUE(read(file, both, "1.2.0"));
    EXPECT_EQ(treeText(file), treeText(other));
    const LogCapture log;
    EXPECT_FALSE(read(file, both, "1.2.00"));
    EXPECT_TRUE(file.isEmpty() && file.imagesByUID().isEmpty() && file.seriesByUID().isEmpty());
    EXPECT_FALSE(file.failure().isEmpty());
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(TagFileFormat, WhatLaterVersionsMayAddIsPassedOver)
{
    TagFile file;
    add(file, anImage("1"));
    const QByteArray unknown = QByteArray::fromHex("4d0300ffffff");
    QByteArray content = framed(unknown + bodyOf(file) + unknown);
    content[5] = 7;
    content[6] = 3;
    TagFile again;
    ASSERT_TRUE(read(again, content + "behind the end"));
    EXPECT_EQ(treeText(again), treeText(file));
}

/// What the reader would refuse, or lose something of.
struct Unreadable
{
    const char* reason;
    void (*spoil)(TagFile& file);
};

void nest(TagFile& file, int depth)
{
    std::unique_ptr<TagSequence> outermost;
    for (int i = 0; i < depth; ++i) {
        auto* item = new TagMap;
        if (outermost != nullptr)
            item->putElement(DCM_RequestAttributesSequence, outermost.release());
        outermost = std::make_unique<TagSequence>();
        outermost->addItem(item);
    }
    file.findImage("2")->putElement(DCM_RequestAttributesSequence, outermost.release());
}

/// More items and values than the format allows, which share their values, so that few are in memory.
void addTooMany(TagFile& file)
{
    constexpr int kValues = 4000;
    auto* sequence = new TagSequence;
    auto* first = new TagMap;
    for (int i = 0; i < kValues; ++i)
        first->markAsMissing({0x0009, static_cast<Uint16>(0x1000 + i)});
    sequence->addItem(first);
    for (int i = 0; i < kMaxElements / kValues; ++i)
        sequence->addItem(new TagMap(*first));
    file.study()->putElement(DCM_RequestAttributesSequence, sequence);
}

const Unreadable kUnreadable[] = {
    {"Tag file would nest sequence items deeper than the format allows",
     [](TagFile& file) { nest(file, kMaxItemDepth + 1); }},
    {"Tag file would hold more nodes, items and values than the format allows", addTooMany},
    {"Tag file would be larger than the format allows",
     [](TagFile& file) {
         const QByteArray half(static_cast<int>(kMaxBodySize / 2), 'x');
         file.findImage("1")->putAndInsertValue(DCM_PixelData, VrCode::OB, half);
         file.findImage("2")->putAndInsertValue(DCM_PixelData, VrCode::OB, half);
     }},
    {"Tag file would hold image 1 twice",
     [](TagFile& file) { file.findImage("2")->putAndInsertString(DCM_SOPInstanceUID, "1"); }},
    {"Tag file would hold image without UID twice",
     [](TagFile& file) {
         file.findImage("1")->deleteElement(DCM_SOPInstanceUID);
         file.findImage("2")->deleteElement(DCM_SOPInstanceUID);
     }},
    {"Tag file would hold series 1.2.3 twice",
     [](TagFile& file) {
         TagFileTest::add(file, anImage("3").inSeries("1.2.4"));
         file.findSeries("1.2.4")->putAndInsertString(DCM_SeriesInstanceUID, "1.2.3");
     }},
    {"Tag file of study 1.2 would hold study 9",
     [](TagFile& file) { file.study()->putAndInsertString(DCM_StudyInstanceUID, "9"); }},
};

TEST_F(TagFileFormat, IsNotWrittenWithWhatItsReaderWouldRefuse)
{
    for (const Unreadable& row : kUnreadable) {
        TagFile file;
        add(file, anImage("1"));
        ASSERT_TRUE(file.writeCacheFile());
        const QByteArray before = content();
        add(file, anImage("2"));
        row.spoil(file);
        const LogCapture log;
        EXPECT_FALSE(file.writeCacheFile());
        EXPECT_EQ(file.failure(), QLatin1String(row.reason));
        EXPECT_EQ(log.count(row.reason), 1);
        EXPECT_EQ(content(), before);
    }
    TagFile file;
    add(file, anImage("1"));
    add(file, anImage("2"));
    nest(file, kMaxItemDepth);
    TagFile again;
    ASSERT_TRUE(read(again, written(file))) << "what its reader just takes";
    nest(file, kMaxItemDepth + 1);
    QByteArray streamed;
    QDataStream out(&streamed, QIODevice::WriteOnly);
    EXPECT_FALSE(file.writeCacheFile(out) || file.mergeIntoCacheFile());
    EXPECT_TRUE(streamed.isEmpty());
}

/// The message, and the byte of the header that is to blame.
const std::tuple<const char*, int, char> kRefusals[] = {
    {"Tag file has incorrect header", 3, 'b'},
    {"Tag file has unsupported version", 4, 1},
    {"Tag file has unsupported compression format", 7, 3},
    {"Tag file seems to be truncated", 8, -1},
    {"Tag file seems to be truncated", 9, 1},
};

TEST_F(TagFileFormat, SaysWhyItCannotBeRead)
{
    for (const auto& [message, at, byte] : kRefusals) {
        const LogCapture log;
        QByteArray content = writtenWithPreviews();
        content[at] = byte;
        TagFile file;
        add(file, anImage("held before"));
        EXPECT_FALSE(read(file, content));
        EXPECT_TRUE(file.isEmpty());
        EXPECT_EQ(log.lines(), std::vector<std::string>{message});
        EXPECT_EQ(file.failure(), QLatin1String(message));
    }
}

}  // namespace
