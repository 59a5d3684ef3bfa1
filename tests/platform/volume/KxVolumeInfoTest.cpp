#include "Pixels.h"
#include "platform/volumefile/VolumeFileBuilder.h"
#include "support/FileContent.h"

#include <QProcess>

#include <limits>

using namespace Kdd;

namespace
{

std::shared_ptr<KxVolumeInfo> show(const DatasetBuilder& image, int width = 0, int height = 0)
{
    Result result;
    auto info =
        KxVolumeInfo::readVolumeInfo(&image.dataset(), width, height, QStringLiteral("image.dcm"), result);
    EXPECT_TRUE(result.good()) << qPrintable(result.text());
    return info;
}

DatasetBuilder ramp()
{
    return aPicture(1, 4, 16).words({0, 100, 1000, 2000});
}

DatasetBuilder signedRamp()
{
    return aPicture(1, 4, 16)
        .with(DCM_PixelRepresentation, "1")
        .words({0xf830, 0xff9c, 0, 1000});  // -2000, -100
}

DatasetBuilder lookUp(const std::vector<Uint16>& descriptor, const std::vector<Uint16>& entries)
{
    return anItem().numbers(DCM_LUTDescriptor, descriptor).words(entries, DCM_LUTData);
}

/// Attributes of a frame as enhanced images keep them.
DatasetBuilder group(const DcmTagKey& sequence, const DatasetBuilder& attributes)
{
    return anItem().withItem(sequence, attributes);
}

DatasetBuilder window(const char* center, const char* width)
{
    return anItem().with(DCM_WindowCenter, center).with(DCM_WindowWidth, width);
}

DatasetBuilder rampInWindow(const char* center, const char* width)
{
    return ramp().with(DCM_WindowCenter, center).with(DCM_WindowWidth, width);
}

const std::tuple<const char*, DatasetBuilder, float, float> kRanges[] = {
    {"OfThePixels", ramp(), 0, 2000},
    {"OfTheWindow", rampInWindow("500", "400"), 300, 700},
    {"OfTheFirstUsableWindow", rampInWindow("5\\500", "0\\400"), 300, 700},
    {"NotOfAWindowBesideThePixels", rampInWindow("9000", "400"), 0, 2000},
    {"NotOfAWindowThatIsNoNumber", rampInWindow("x", "400"), 0, 2000},
    {"Rescaled", ramp().with("RescaleSlope=2|RescaleIntercept=-1000"), -1000, 3000},
    {"RescaledDownwards", ramp().with("RescaleSlope=-1|RescaleIntercept=0"), -2000, 0},
    {"WithoutPadding", signedRamp().numbers(DCM_PixelPaddingValue, {0xf830}), -100, 1000},
    {"WithoutPaddingRange",
     signedRamp().numbers(DCM_PixelPaddingValue, {0xf830}).numbers(DCM_PixelPaddingRangeLimit, {0xff9c}), 0,
     1000},
    {"OfOneValueBesidesPadding", ramp().words({0, 0, 255, 255}).numbers(DCM_PixelPaddingValue, {0}), 0, 255},
    {"OfTheLogarithm",
     ramp()
         .with("Modality=XA|PixelIntensityRelationship=LOG")
         .withItem(DCM_ModalityLUTSequence, lookUp({3, 99, 16}, {7, 500, 900})),
     0, 2000},
    {"OfTheModalityTable", ramp().withItem(DCM_ModalityLUTSequence, lookUp({3, 99, 16}, {7, 500, 900})), 7,
     900},
    {"OfTheModalityTableWithoutPadding",
     ramp()
         .words({0, 100, 100, 2000})
         .numbers(DCM_PixelPaddingValue, {2000})
         .withItem(DCM_ModalityLUTSequence, lookUp({3, 99, 16}, {7, 500, 900})),
     7, 500},
    {"OfTheVoiTable", ramp().withItem(DCM_VOILUTSequence, lookUp({2, 99, 16}, {10, 4000})), 10, 4000},
    {"OfTheWindowOfTheFrame",
     ramp()
         .withItem(DCM_SharedFunctionalGroupsSequence, group(DCM_FrameVOILUTSequence, window("9", "9")))
         .withItem(DCM_PerFrameFunctionalGroupsSequence,
                   group(DCM_FrameVOILUTSequence, window("500", "400"))),
     300, 700},
    {"RescaledAsAllFramesAre",
     ramp().withItem(
         DCM_SharedFunctionalGroupsSequence,
         group(DCM_PixelValueTransformationSequence, anItem().with("RescaleSlope=3|RescaleIntercept=1"))),
     1, 6001},
};

TEST(KxVolumeInfo, TakesTheRangeFromWhereTheImageTellsIt)
{
    for (const auto& [name, image, lowest, highest] : kRanges) {
        const auto info = show(image);
        ASSERT_TRUE(info) << name;
        EXPECT_EQ(std::pair(info->lowestValue(), info->highestValue()), std::pair(lowest, highest)) << name;
    }
}

TEST(KxVolumeInfo, SpreadsARangeOfFewSteps)
{
    const auto info = show(aPicture(1, 4, 1).bytes({0x0a, 0}));  // 0 1 0 1
    EXPECT_EQ(numbersOf(*info), (QVector<double>{0, 65535, 0, 65535}));
    EXPECT_EQ(info->highestValue(), 65535);
    const auto mask = aPicture(2, 4, 1).bytes({0x0b, 0});  // 1 1 0 1 above 0 0 0 0
    EXPECT_EQ(numbersOf(*show(mask, 2, 1)), (QVector<double>{32767.5, 16383.75}));
}

TEST(KxVolumeInfo, FloatPixelsWithoutValueAreBlack)
{
    const float values[] = {-100, std::numeric_limits<float>::quiet_NaN(), 700, 9999};
    auto image = aPicture(1, 4, 32);
    image.dataset().putAndInsertFloat32Array(DcmTag(DCM_FloatPixelData, EVR_OF), values, 4);
    image.dataset().putAndInsertFloat32(DCM_FloatPixelPaddingValue, 9999);
    const auto info = show(image);
    EXPECT_EQ(numbersOf(*info), (QVector<double>{-100, -100, 700, 9999}));
    EXPECT_EQ(info->highestValue(), 700);
    EXPECT_EQ(info->primitiveType(), PrimitiveType::Float32);
}

TEST(KxVolumeInfo, ReducesByMeansOfWholeBlocks)
{
    const auto image = aPicture(2, 5, 8).bytes({10, 20, 100, 110, 9, 30, 43, 120, 131, 9});
    EXPECT_EQ(numbersOf(*show(image, 2, 1)), (QVector<double>{26, 115}));
    EXPECT_EQ(show(image, 3, 1)->width(), 5);  // halves would be below three
}

const std::tuple<const char*, DcmTagKey, const char*, float> kAspects[] = {
    {"Spacing", DCM_PixelSpacing, "2\\1", 0.5F},      {"Imager", DCM_ImagerPixelSpacing, "0.5\\1", 2},
    {"Ratio", DCM_PixelAspectRatio, "4\\3", 0.75F},   {"Zero", DCM_PixelSpacing, "0\\1", 1},
    {"Unbelievable", DCM_PixelSpacing, "1\\1000", 1}, {"One", DCM_PixelSpacing, "1", 1}};

TEST(KxVolumeInfo, AspectIsWidthOverHeight)
{
    for (const auto& [name, key, value, aspect] : kAspects)
        EXPECT_EQ(show(ramp().with(key, value))->pixelAspectRatio(), aspect) << name;
}

TEST(KxVolumeInfo, LowValuesAreWhiteWhereTheImageSaysSo)
{
    EXPECT_TRUE(show(ramp().with(DCM_PhotometricInterpretation, "MONOCHROME1"))->isInverted());
    EXPECT_TRUE(show(ramp().with(DCM_PresentationLUTShape, "INVERSE"))->isInverted());
    EXPECT_FALSE(show(ramp())->isInverted());
}

DatasetBuilder paletteImage(const std::vector<Uint16>& descriptor, const std::vector<Uint16>& red)
{
    auto image = aPicture(1, 3, 8).with(DCM_PhotometricInterpretation, "PALETTE COLOR").bytes({0, 5, 9, 0});
    image.numbers(DCM_RedPaletteColorLookupTableDescriptor, descriptor);
    image.numbers(DCM_GreenPaletteColorLookupTableDescriptor, descriptor);
    image.numbers(DCM_BluePaletteColorLookupTableDescriptor, descriptor);
    image.words(red, DCM_RedPaletteColorLookupTableData);
    image.words(std::vector<Uint16>(red.size(), 0), DCM_GreenPaletteColorLookupTableData);
    return image.words(std::vector<Uint16>(red.size(), 0), DCM_BluePaletteColorLookupTableData);
}

TEST(KxVolumeInfo, AppliesPalettesOfEightAndSixteenBits)
{
    const QVector<double> expected{0x10, 0, 0, 0x20, 0, 0, 0x30, 0, 0};  // below, at and above the entries
    EXPECT_EQ(numbersOf(*show(paletteImage({3, 4, 16}, {0x1000, 0x2000, 0x3000}))), expected);
    EXPECT_EQ(numbersOf(*show(paletteImage({3, 4, 8}, {0x10, 0x20, 0x30}))), expected);
    EXPECT_EQ(numbersOf(*show(paletteImage({3, 4, 8}, {0x2010, 0x0030}))),
              expected);  // packed, two to a word
}

TEST(KxVolumeInfo, RefusesAPaletteOfFewerEntriesThanItSays)
{
    Result result;
    const auto image = paletteImage({300, 0, 16}, {1, 2, 3});
    EXPECT_FALSE(KxVolumeInfo::readVolumeInfo(&image.dataset(), 8, 8, QStringLiteral("image.dcm"), result));
    EXPECT_STREQ(qPrintable(result.text()), "image.dcm: Palette: A look-up table of 300 entries has 6 bytes");
}

TEST(KxVolumeInfo, OfManyFramesAnEmptyOneIsNotShown)
{
    std::vector<Uint8> values(24, 0);
    values[11] = 200;  // the second pixel of the sixth of twelve frames; the middle one is the seventh
    const auto info = show(aPicture(1, 2, 8).with(DCM_NumberOfFrames, "12").bytes(values));
    EXPECT_EQ(numbersOf(*info), (QVector<double>{0, 200}));
}

TEST(KxVolumeInfo, OfAVideoShowsAFrameAtThreeTenths)
{
    const QTemporaryDir folder;
    const QString path = folder.filePath(QStringLiteral("fade.mp4"));
    const char* fade =
        "-loglevel error -f lavfi -i color=red:s=64x64:r=10:d=4,fade=out:st=0:d=4:color=blue -c:v libx264";
    ASSERT_EQ(QProcess::execute(QStringLiteral("ffmpeg"), QString::fromLatin1(fade).split(QLatin1Char(' '))
                                                              << path),
              0);
    const QByteArray video = fileContent(path);
    // The fragments of a video are cut anywhere.
    const auto image = aPicture(64, 64, 8, "YBR_PARTIAL_420")
                           .with(DCM_NumberOfFrames, "40")
                           .fragments(EXS_MPEG4HighProfileLevel4_1, {"", video.left(1000), video.mid(1000)});
    const auto info = show(image, 32, 32);
    ASSERT_TRUE(info);
    EXPECT_EQ(info->width(), 32);
    EXPECT_NEAR(numbersOf(*info).at(0), 255 * 0.7, 12);  // red
    EXPECT_NEAR(numbersOf(*info).at(2), 255 * 0.3, 12);  // blue
}

TEST(KxVolumeInfo, ShowsASliceOfAVolumeFileInItsWindow)
{
    ParamBundle parameters;
    parameters.insert("BoundingBox", Parameter::ofReals({0, 20, 0, 20, 0, 1}));
    parameters.insert("WindowCenter", Parameter::ofReals({500}));
    parameters.insert("WindowWidth", Parameter::ofReals({200}));
    const VolumeFileBuilder file;
    ASSERT_TRUE(file.write(aLattice(), parameters).good());
    const auto mesh = file.open();
    Result result;
    const auto info = KxVolumeInfo::readVolumeInfo(*mesh, 0, 0, 2, result);
    ASSERT_TRUE(info) << qPrintable(result.text());
    EXPECT_EQ(numbersOf(*info), numbersOf(sliceOf(aLattice(), 2)));
    EXPECT_EQ(info->lowestValue(), 400);
    EXPECT_EQ(info->highestValue(), 600);
    EXPECT_EQ(info->pixelAspectRatio(), 0.5F);
    EXPECT_FALSE(KxVolumeInfo::readVolumeInfo(*mesh, 0, 0, 3, result));
    EXPECT_FALSE(KxVolumeInfo::fromFrame(nullptr, {2, 1, 3, PrimitiveType::UInt8, "abc"})) << "too few bytes";
}

}  // namespace
