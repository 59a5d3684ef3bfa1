#include "Pixels.h"
#include "platform/volume/FragmentReader.h"
#include "support/BytesRead.h"

#include <QTemporaryDir>

#include <gtest/gtest.h>

using namespace Kdd;

namespace
{

QVector<double> storedNumbers(const DatasetBuilder& image, int frame = 0)
{
    StoredFrame stored;
    const Result result = readStoredFrame(image.dataset(), frame, 0, stored);
    EXPECT_TRUE(result.good()) << qPrintable(result.text());
    return numbersOf(stored.pixels);
}

DatasetBuilder twelveBits(const char* highBit)
{
    return aPicture(1, 2, 16).with(DCM_BitsStored, "12").with(DCM_HighBit, highBit);
}

const std::tuple<const char*, DatasetBuilder, QVector<double>> kLayouts[] = {
    {"Bytes", aPicture(1, 2, 8).bytes({7, 255}), {7, 255}},
    {"SignedBytes", aPicture(1, 2, 8).with(DCM_PixelRepresentation, "1").bytes({7, 255}), {7, -1}},
    {"OverlayBitsAbove", twelveBits("11").words({0xf123, 0x1fff}), {0x123, 0xfff}},
    {"SignedTwelveBits",
     twelveBits("11").with(DCM_PixelRepresentation, "1").words({0x0fff, 0x07ff}),
     {-1, 2047}},
    {"HighBitAtTheTop", twelveBits("15").words({0x123f, 0xfff0}), {0x123, 0xfff}},
    {"ImpossibleHighBit", twelveBits("40").words({0x123, 0xfff}), {0x123, 0xfff}},
    {"MoreStoredThanAllocated", aPicture(1, 2, 16).with(DCM_BitsStored, "99").words({1, 65535}), {1, 65535}},
    {"ThirtyTwoBits", aPicture(1, 1, 32).words({0x0001, 0x8000}), {2147483649.0}},
    {"Planes",
     aPicture(1, 2, 8, "RGB").with(DCM_PlanarConfiguration, "1").bytes({1, 2, 3, 4, 5, 6}),
     {1, 3, 5, 2, 4, 6}},
    {"SharedChroma", aPicture(1, 2, 8, "YBR_FULL_422").bytes({1, 2, 3, 4}), {1, 3, 4, 2, 3, 4}},
    {"ChromaNotSharedAfterAll",
     aPicture(1, 2, 8, "YBR_FULL_422").bytes({1, 2, 3, 4, 5, 6}),
     {1, 2, 3, 4, 5, 6}},
};

TEST(StoredFrame, UnpacksEveryLayout)
{
    for (const auto& [name, image, expected] : kLayouts)
        EXPECT_EQ(storedNumbers(image), expected) << name;
}

TEST(StoredFrame, FramesOfSingleBitsNeedNotBeginAtAByte)
{
    // Three frames of five pixels: 10101, 01010, 11100, the first pixel in the lowest bit.
    const auto image = aPicture(1, 5, 1).with(DCM_NumberOfFrames, "3").bytes({0x55, 0x1d});
    EXPECT_EQ(storedNumbers(image, 0), (QVector<double>{1, 0, 1, 0, 1}));
    EXPECT_EQ(storedNumbers(image, 1), (QVector<double>{0, 1, 0, 1, 0}));
    EXPECT_EQ(storedNumbers(image, 2), (QVector<double>{1, 1, 1, 0, 0}));
}

const std::tuple<const char*, DatasetBuilder, int, const char*> kRefusals[] = {
    {"NoPixels", aPicture(1, 1, 8), 0, "There are no pixel data"},
    {"NoRows", aPicture(0, 1, 8).bytes({1, 2}), 0, "1 columns and 0 rows are no size of an image"},
    {"Huge", aPicture(65535, 65535, 8).bytes({1, 2}), 0,
     "65535 columns and 65535 rows are no size of an image"},
    {"TooShort", aPicture(2, 2, 16).words({1, 2, 3}), 0, "Pixel data of 6 bytes end before frame 1 does"},
    {"FrameBeyond", aPicture(1, 2, 8).bytes({1, 2}), 1, "There is no frame 2 among 1"},
    {"FramesClaimed", aPicture(1, 2, 8).with(DCM_NumberOfFrames, "2147483647").bytes({1, 2}), 2147483646,
     "Pixel data of 2 bytes end before frame 2147483647 does"},
    {"OddBits", aPicture(1, 2, 12).bytes({1, 2, 3, 4}), 0, "Pixels of 12 bits cannot be decoded"},
    {"OddSamples", aPicture(1, 2, 8).with(DCM_SamplesPerPixel, "4").bytes({1, 2}), 0,
     "Pixels of 4 samples cannot be decoded"},
};

TEST(StoredFrame, RefusesWhatCannotBeAnImage)
{
    for (const auto& [name, image, frame, reason] : kRefusals) {
        StoredFrame stored;
        const Result result = readStoredFrame(image.dataset(), frame, 0, stored);
        EXPECT_STREQ(qPrintable(result.text()), reason) << name;
    }
}

TEST(StoredFrame, ReadsOneFrameOfAFileAndNoMore)
{
    constexpr int kSide = 256;
    const QTemporaryDir folder;
    const QByteArray path = folder.filePath(QStringLiteral("loop.dcm")).toLocal8Bit();
    auto image = aPicture(kSide, kSide, 16).with(DCM_NumberOfFrames, "24");
    image.with(DCM_SOPClassUID, UID_UltrasoundMultiframeImageStorage).with(DCM_SOPInstanceUID, "1.2");
    std::vector<Uint16> values;
    for (Uint16 frame = 0; frame < 24; ++frame)
        values.insert(values.end(), size_t(kSide) * kSide, frame);
    image.words(values).save(QFile::decodeName(path));

    DcmFileFormat file;
    const qint64 before = bytesRead();
    ASSERT_TRUE(file.loadFile(path.constData(), EXS_Unknown, EGL_noChange, 4096).good());
    StoredFrame stored;
    ASSERT_TRUE(readStoredFrame(*file.getDataset(), 20, 0, stored).good());
    EXPECT_LT(bytesRead() - before, kSide * kSide * 2 + 64 * 1024);
    EXPECT_EQ(numbersOf(stored.pixels), QVector<double>(kSide * kSide, 20));
}

const QByteArray kStart = "\xff\xd8\xff";

/// Parts, of which the first is the offset table, and one of so many frames in them.
const std::tuple<const char*, QVector<QByteArray>, int, int, QByteArray> kFragments[] = {
    {"OneForEachFrame", {"", "aa", "bb", "cc"}, 1, 3, "bb"},
    {"AllOfOneFrame", {"", "aa", "bb", "cc"}, 0, 1, "aabbcc"},
    {"ByTheTable", {QByteArray("\0\0\0\0\x14\0\0\0", 8), "aa", "bb", "cc", "dd"}, 1, 2, "ccdd"},
    {"ByTheTableTheFirst", {QByteArray("\0\0\0\0\x14\0\0\0", 8), "aa", "bb", "cc", "dd"}, 0, 2, "aabb"},
    {"ByStarts", {"", kStart + "a", "bb", kStart + "c", "dd", kStart + "e"}, 1, 3, kStart + "cdd"},
    {"TableThatIsNotAscending", {QByteArray(8, 0), kStart + "a", "bb", kStart + "c"}, 0, 2, kStart + "abb"},
    {"NothingTellsTheFrames", {"", "aa", "bb", "cc"}, 1, 2, ""},
    {"NoFragments", {""}, 0, 1, ""},
};

TEST(FragmentReader, FindsTheFragmentsOfAFrame)
{
    for (const auto& [name, parts, frame, frames, expected] : kFragments) {
        QByteArray bytes;
        const Result result = readFrameBytes(*sequenceOf(parts), frame, frames, bytes);
        EXPECT_EQ(result.good(), !expected.isEmpty()) << name;
        EXPECT_EQ(bytes, expected) << name;
    }
}

}  // namespace
