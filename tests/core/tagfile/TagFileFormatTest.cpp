#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/volumes/Volume.h"
#include "platform/base/KxMsg.h"
#include "support/DatasetBuilder.h"
#include "support/LogCapture.h"
#include "support/TreeText.h"

#include <QDataStream>

#include <gtest/gtest.h>

#include <array>

using namespace Kdd;

namespace
{

using Mode = TagFile::CompressionMode;

constexpr int kHeaderSize = 12;
constexpr int kLayoutAt = 6;
constexpr int kCompressionAt = 7;
constexpr Mode kModes[] = {Mode::None, Mode::Zlib, Mode::Lzma};

const DcmTagKey kPreview(0x0006, 0x7105);
const DcmTagKey kPreviewIndex(0x0006, 0x7106);
const QByteArray kPreviewElement = QByteArray::fromHex("06000671090100");  // up to its value of one character

/// Writes without compression unless a test says otherwise.
class TagFileFormat : public testing::Test
{
protected:
    void SetUp() override { TagFile::setCompressionMode(Mode::None); }
    void TearDown() override { TagFile::setCompressionMode(Mode::Zlib); }

    static TagMap* add(TagFile& file, const DatasetBuilder& image)
    {
        return file.addTagMap(image.map(), nullptr, false);
    }

    static void addWithPreview(TagFile& file, const char* uid, const QByteArray& jpeg)
    {
        add(file, anImage(uid))->putAndInsertValue(kPreview, VrCode::OB, jpeg);
    }

    static QByteArray written(TagFile& file)
    {
        QByteArray content;
        QDataStream out(&content, QIODevice::WriteOnly);
        EXPECT_TRUE(file.writeCacheFile(out));
        return content;
    }

    static QByteArray bodyOf(TagFile& file)
    {
        const QByteArray content = written(file);
        QDataStream in(content.mid(kHeaderSize - 4));
        qint32 size = 0;
        in >> size;
        return content.mid(kHeaderSize, size);
    }

    /// A whole file, without compression and previews.
    static QByteArray framed(const QByteArray& body)
    {
        QByteArray content("TaCa\0\0\2\0", kHeaderSize - 4);
        QDataStream out(&content, QIODevice::WriteOnly | QIODevice::Append);
        out << body << qint32(0);  // a byte array and a body have the same form
        return content;
    }

    static bool read(TagFile& file, const QByteArray& content, const char* studyUID = nullptr)
    {
        QDataStream in(content);
        return file.readCacheFile(in, studyUID);
    }

    static QByteArray previewOf(const TagFile& file, const char* uid)
    {
        const TagElement* preview = file.findImage(uid)->findElement(kPreview);
        return preview != nullptr ? preview->value() : QByteArray("none");
    }
};

/// A study with something of everything that a record can hold.
void fill(TagFile& file)
{
    for (const char* uid : {"1", "2", "3"}) {
        DatasetBuilder image = anImage(uid).with(DCM_PatientName, "Doe^J").with(DCM_Rows, "512");
        image.inSeries(*uid == '3' ? "1.2.4" : "1.2.3");
        image.withItem(
            DCM_RequestAttributesSequence,
            anItem().with(DCM_CodeValue, uid).withItem(DCM_RequestedProcedureCodeSequence, anItem()));
        if (*uid != '2')
            image.withLong(DCM_TextValue, 2000).with(DCM_PatientComments, "not in all");
        file.addTagMap(image.map(), nullptr, false)
            ->putAndInsertValue(kPreview, VrCode::OB, QByteArray(uid) + "jpeg");
    }
    auto* volume = new Volume;
    volume->setPreviewData("the volume's jpeg");
    file.findSeries("1.2.3")->addBareVolume(volume);
    file.optimizeAll();
}

TEST_F(TagFileFormat, IsFixedToTheByte)
{
    TagFile file;
    add(file, anImage("1.2.3.1").without(DCM_SOPClassUID));
    const QByteArray expected = QByteArray::fromHex("54614361 00 00 02 00"
                                                    "0000002d"
                                                    "00 0a00 20000d00 16 0300 312e32"
                                                    "01 0c00 20000e00 16 0500 312e322e33"
                                                    "02 0e00 08001800 16 0700 312e322e332e31"
                                                    "00000000");
    EXPECT_EQ(written(file).toHex(), expected.toHex());
}

TEST_F(TagFileFormat, EveryCompressionIsReadWhateverIsSet)
{
    TagFile file;
    fill(file);
    for (const Mode mode : kModes) {
        TagFile::setCompressionMode(mode);
        const QByteArray content = written(file);
        EXPECT_EQ(content.left(kHeaderSize - 4).toHex(),
                  QByteArray("5461436100000200").replace(15, 1, QByteArray::number(int(mode))));
        for (const Mode present : kModes) {
            TagFile::setCompressionMode(present);
            TagFile again;
            ASSERT_TRUE(read(again, content));
            EXPECT_EQ(treeText(again), treeText(file));
        }
    }
}

TEST_F(TagFileFormat, WhatWasReadIsWrittenAsItWas)
{
    TagFile file;
    fill(file);
    const QByteArray content = written(file);
    TagFile again;
    ASSERT_TRUE(read(again, content));
    EXPECT_EQ(imagesText(again), imagesText(file));
    EXPECT_EQ(again.findSeries("1.2.3")->volumes().at(0)->previewData(), "the volume's jpeg");
    EXPECT_EQ(written(again).toHex(), content.toHex());
}

TEST_F(TagFileFormat, TheOldLayoutRunsToTheEndAndHasNoPreviews)
{
    TagFile file;
    addWithPreview(file, "1", "jpeg");
    // More than one piece of reading.
    file.findImage("1")->putAndInsertValue(DCM_PixelData, VrCode::OB, QByteArray(600000, 'x'));
    TagFile again;
    ASSERT_TRUE(read(again, QByteArray("TaCa\0\0\1\0", 8) + bodyOf(file)));
    EXPECT_EQ(previewOf(again, "1"), "none");
    again.findImage("1")->putAndInsertValue(kPreview, VrCode::OB, "jpeg");
    EXPECT_EQ(imagesText(again), imagesText(file));
}

TEST_F(TagFileFormat, PreviewsStandBehindTheBodyAndAreNumberedInIt)
{
    TagFile file;
    addWithPreview(file, "1", "first jpeg");
    addWithPreview(file, "2", "second jpeg");
    const QByteArray body = bodyOf(file);
    EXPECT_FALSE(body.contains("jpeg"));
    EXPECT_EQ(body.count(kPreviewElement + '0'), 1);
    EXPECT_EQ(body.count(kPreviewElement + '1'), 1);
    const QByteArray table = QByteArray::fromHex("00000002 0000000a") + "first jpeg" +
                             QByteArray::fromHex("0000000b") + "second jpeg";
    EXPECT_EQ(written(file).mid(kHeaderSize + body.size()), table);
    TagFile again;
    ASSERT_TRUE(read(again, written(file)));
    EXPECT_EQ(again.findImage("2")->findElement(kPreview)->vr(), VrCode::OB);
    EXPECT_EQ(again.findImage("2")->findElement(kPreviewIndex), nullptr);
    EXPECT_EQ(imagesText(again), imagesText(file));
}

TEST_F(TagFileFormat, APreviewWhoseNumberNamesNothingIsDropped)
{
    TagFile file;
    addWithPreview(file, "1", "first jpeg");
    addWithPreview(file, "2", "second jpeg");
    for (const char number : {'2', '9', '-', 'x', ' ', '\0'}) {
        QByteArray content = written(file);
        content.replace(kPreviewElement + '1', kPreviewElement + number);
        TagFile again;
        ASSERT_TRUE(read(again, content));
        EXPECT_EQ(previewOf(again, "1"), "first jpeg");
        EXPECT_EQ(previewOf(again, "2"), "none");
        EXPECT_EQ(again.findImage("2")->findElement(kPreviewIndex), nullptr);
    }
}

TEST_F(TagFileFormat, ATableOfFewerPreviewsThanCountedIsAccepted)
{
    TagFile file;
    addWithPreview(file, "1", "first jpeg");
    addWithPreview(file, "2", "second jpeg");
    const QByteArray content = written(file);
    for (const int lost : {1, 10, 13, 14}) {
        const LogCapture log;
        TagFile again;
        ASSERT_TRUE(read(again, content.chopped(lost)));
        EXPECT_EQ(previewOf(again, "1"), "first jpeg");
        EXPECT_EQ(previewOf(again, "2"), "none");
        EXPECT_TRUE(log.lines().empty());
    }
}

struct LengthCode
{
    int length;
    const char* hex;
};

const LengthCode kLengthCodes[] = {
    {0, "0000"}, {1, "0100"}, {65534, "feff"}, {65535, "ffffffff0000"}, {65536, "ffff00000100"},
};

TEST_F(TagFileFormat, LengthsFrom65535OnTakeSixBytes)
{
    for (const LengthCode& row : kLengthCodes) {
        KxMsg message;
        TagMap::writeLength(message, row.length);
        EXPECT_EQ(message.bytes().toHex(), row.hex);
        EXPECT_EQ(TagMap::readLength(message), row.length);
        EXPECT_EQ(message.remaining(), 0);
        EXPECT_FALSE(message.failed());
    }
}

TEST_F(TagFileFormat, ValuesAndRecordsAroundTheLongLengthComeBack)
{
    // The record is longer than the value by the UID and the two heads.
    for (int length = 65500; length <= 65540; ++length) {
        TagFile file;
        add(file, anImage("1"))->putAndInsertValue(DCM_PixelData, VrCode::OB, QByteArray(length, 'x'));
        TagFile again;
        ASSERT_TRUE(read(again, written(file)));
        EXPECT_EQ(again.findImage("1")->findElement(DCM_PixelData)->value().size(), length);
        EXPECT_EQ(imagesText(again), imagesText(file));
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
    EXPECT_TRUE(file.isEmpty());
    EXPECT_TRUE(file.imagesByUID().isEmpty() && file.seriesByUID().isEmpty());
    EXPECT_FALSE(file.failure().isEmpty());
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(TagFileFormat, WhatLaterVersionsMayAddIsPassedOver)
{
    TagFile file;
    add(file, anImage("1"));
    const QByteArray unknown = QByteArray::fromHex("4d0300ffffff");
    QByteArray content = framed(unknown + bodyOf(file) + unknown);
    content[kLayoutAt - 1] = 7;
    content[kLayoutAt] = 3;
    TagFile again;
    ASSERT_TRUE(read(again, content + "behind the end"));
    EXPECT_EQ(treeText(again), treeText(file));
}

struct Refusal
{
    const char* message;
    int at;
    char byte;
};

const Refusal kRefusals[] = {
    {"Tag file has incorrect header", 3, 'b'},
    {"Tag file has unsupported version", 4, 1},
    {"Tag file seems to be truncated", kHeaderSize - 3, 1},
    {"Tag file seems to be truncated", kHeaderSize - 4, -1},
    {"Tag file has unsupported compression format", kCompressionAt, 3},
};

TEST_F(TagFileFormat, SaysWhyItCannotBeRead)
{
    TagFile file;
    add(file, anImage("1"));
    for (const Refusal& row : kRefusals) {
        const LogCapture log;
        QByteArray content = written(file);
        content[row.at] = row.byte;
        TagFile again;
        add(again, anImage("9"));
        EXPECT_FALSE(read(again, content));
        EXPECT_TRUE(again.isEmpty());
        EXPECT_EQ(log.lines(), std::vector<std::string>{row.message});
        EXPECT_EQ(again.failure(), QLatin1String(row.message));
    }
}

}  // namespace
