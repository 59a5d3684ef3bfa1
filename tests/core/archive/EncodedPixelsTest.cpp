#include "core/archive/WholeDataset.h"
#include "kddlib/Limits.h"
#include "kddlib/net/dicom/DicomFileReader.h"
#include "kddlib/tagmodel/TagMap.h"
#include "support/DatasetBuilder.h"
#include "support/FileContent.h"

#include <dcmtk/dcmdata/dcrledrg.h>
#include <dcmtk/dcmjpeg/djdecode.h>
#include <dcmtk/dcmjpls/djdecode.h>
#include <gtest/gtest.h>

#include <memory>
#include <random>

using namespace Kdd;

namespace
{

constexpr const char* kRle = "1.2.840.10008.1.2.5";
constexpr const char* kJpeg = "1.2.840.10008.1.2.4.70";
constexpr const char* kJpegLs = "1.2.840.10008.1.2.4.80";

/// The whole file in that syntax; empty when it cannot be made.
QByteArray fileIn(const QByteArray& syntax, ByteSource& source, const FrameIndex& index)
{
    DcmFileFormat file;
    CorrectedDataset dataset;
    if (readDicomBuffer(source.bytes(), file).bad())
        return {};
    const std::unique_ptr<TagMap> image(TagMap::createTagMap(file.getDataset(), kDefaultValueBound));
    if (dataset.make(source, index, *image, syntax).bad())
        return {};
    return wholeOf(dataset, source, index, syntax);
}

/// Before the library does it: who comes first decides whether colours are converted.
const bool kRegistered = [] {
    DJDecoderRegistration::registerCodecs(EDC_never);
    DJLSDecoderRegistration::registerCodecs();
    DcmRLEDecoderRegistration::registerCodecs();
    return true;
}();

/// The pixels as DCMTK decodes them, colours left as they are; null where it cannot.
QByteArray pixelsByDcmtk(const QByteArray& bytes, OFString& photometric)
{
    DcmFileFormat file;
    DcmElement* pixels = nullptr;
    if (!kRegistered || readDicomBuffer(bytes, file).bad() ||
        file.getDataset()->chooseRepresentation(EXS_LittleEndianExplicit, nullptr).bad() ||
        file.getDataset()->findAndGetElement(DCM_PixelData, pixels).bad())
        return {};
    file.getDataset()->findAndGetOFString(DCM_PhotometricInterpretation, photometric);
    QByteArray decoded(static_cast<int>(pixels->getLength()), 0);
    return pixels->getPartialValue(decoded.data(), 0, pixels->getLength()).good() ? decoded : QByteArray();
}

/// Of a picture made of noise.
struct Kind
{
    const char* name;
    const char* photometric;
    int rows, columns, bitsAllocated, bitsStored;
    bool isSigned, isPlanar;
    std::vector<const char*> encodings;
};

std::ostream& operator<<(std::ostream& out, const Kind& kind)
{
    return out << kind.name;
}

const Kind kKinds[] = {
    {"Bits", "MONOCHROME2", 5, 7, 1, 1, false, false, {kRle}},
    {"Bytes", "MONOCHROME2", 5, 7, 8, 8, false, false, {kRle, kJpeg, kJpegLs}},
    {"SignedBytes", "MONOCHROME1", 4, 4, 8, 8, true, false, {kRle, kJpeg, kJpegLs}},
    {"OnePixel", "MONOCHROME2", 1, 1, 8, 8, false, false, {kRle, kJpeg, kJpegLs}},
    {"TwelveBitsBesideOverlays", "MONOCHROME2", 6, 5, 16, 12, false, false, {kRle, kJpeg, kJpegLs}},
    {"SignedTwelveBits", "MONOCHROME2", 6, 5, 16, 12, true, false, {kRle, kJpeg, kJpegLs}},
    {"Words", "MONOCHROME2", 63, 65, 16, 16, false, false, {kRle, kJpeg, kJpegLs}},
    {"SignedWords", "MONOCHROME2", 63, 65, 16, 16, true, false, {kRle, kJpeg, kJpegLs}},
    {"LongWords", "MONOCHROME2", 3, 5, 32, 32, false, false, {kRle}},
    {"Palette", "PALETTE COLOR", 9, 9, 8, 8, false, false, {kRle, kJpeg, kJpegLs}},
    {"Rgb", "RGB", 5, 7, 8, 8, false, false, {kRle, kJpeg, kJpegLs}},
    {"RgbByPlane", "RGB", 5, 7, 8, 8, false, true, {kRle, kJpeg, kJpegLs}},
    {"RgbWords", "RGB", 5, 7, 16, 16, false, true, {kRle, kJpeg, kJpegLs}},
    {"Ybr", "YBR_FULL", 5, 7, 8, 8, false, false, {kRle, kJpeg, kJpegLs}},
    {"YbrByPlane", "YBR_FULL", 5, 7, 8, 8, false, true, {kRle, kJpeg, kJpegLs}},
    {"YbrThatSharesChroma", "YBR_FULL_422", 5, 8, 8, 8, false, false, {kRle, kJpeg, kJpegLs}},
    {"YbrPartial", "YBR_PARTIAL_422", 5, 8, 8, 8, false, false, {}},
};

class EncodedKinds : public FileTest, public testing::WithParamInterface<Kind>
{
protected:
    static constexpr int kFrames = 3;

    int samples() const { return QByteArray(GetParam().photometric).size() == 3 || isYbr() ? 3 : 1; }
    bool isYbr() const { return QByteArray(GetParam().photometric).startsWith("YBR"); }
    bool sharesChroma() const { return QByteArray(GetParam().photometric).endsWith("_422"); }

    /// Noise, some of it smooth, so that runs and large steps both occur.
    QByteArray noise() const
    {
        const Kind& kind = GetParam();
        const qint64 values = qint64(kind.rows) * kind.columns * (sharesChroma() ? 2 : samples());
        QByteArray bytes(static_cast<int>((values * kFrames * kind.bitsAllocated + 7) / 8), 0);
        std::mt19937 random(7);
        for (int i = 0; i < bytes.size(); ++i)
            bytes[i] = static_cast<char>(i % 50 < 20 ? 0x5a : random());
        // Bits of a last byte that belong to no pixel.
        if (kind.bitsAllocated == 1)
            bytes[bytes.size() - 1] = 0x01;
        return bytes;
    }

    ByteSource source(const QByteArray& pixels) const
    {
        const Kind& kind = GetParam();
        DatasetBuilder image = aPicture(kind.rows, kind.columns, kind.bitsAllocated, kind.photometric);
        image.with(DCM_BitsStored, QByteArray::number(kind.bitsStored));
        image.with(DCM_HighBit, QByteArray::number(kind.bitsStored - 1));
        image.with(DCM_PixelRepresentation, kind.isSigned ? "1" : "0").with(DCM_NumberOfFrames, "3");
        image.with(DCM_SamplesPerPixel, samples() == 3 ? "3" : "1");
        if (samples() == 3)
            image.with(DCM_PlanarConfiguration, kind.isPlanar ? "1" : "0");
        image.with(DCM_SOPClassUID, UID_SecondaryCaptureImageStorage).with(DCM_SOPInstanceUID, "1.2.3");
        image.data(DcmTag(DCM_PixelData, kind.bitsAllocated > 8 ? EVR_OW : EVR_OB), pixels);
        image.save(path());
        return ByteSource::ofFile(path());
    }

    /// What a decoder has to give: samples side by side, none of them shared.
    QByteArray sideBySide(const QByteArray& pixels) const
    {
        const Kind& kind = GetParam();
        const int width = kind.bitsAllocated / 8;
        const int size = kind.rows * kind.columns;
        QByteArray expected;
        for (int i = 0; i < size * kFrames && sharesChroma(); ++i) {
            expected += pixels.mid(i / 2 * 4 + i % 2, 1);
            expected += pixels.mid(i / 2 * 4 + 2, 2);
        }
        for (int i = 0; i < size * kFrames && kind.isPlanar; ++i) {
            for (int sample = 0; sample < 3; ++sample)
                expected += pixels.mid(((i / size * 3 + sample) * size + i % size) * width, width);
        }
        return expected.isEmpty() ? pixels : expected;
    }
};

TEST_P(EncodedKinds, HaveTheSamePixelsInEverySyntaxAndFromOneIntoAnother)
{
    const QByteArray pixels = noise();
    const QByteArray wanted = sideBySide(pixels);
    ByteSource stored = source(pixels);
    FrameIndex index;
    ASSERT_TRUE(index.read(stored).good());
    const QVector<QByteArray> encodings(GetParam().encodings.begin(), GetParam().encodings.end());
    EXPECT_EQ(index.encodings(), encodings);
    for (const QByteArray& uid : encodings) {
        const QByteArray made = fileIn(uid, stored, index);
        OFString photometric;
        ByteSource again(made);
        FrameIndex encoded;
        ASSERT_TRUE(encoded.read(again).good()) << uid.constData();
        EXPECT_EQ(encoded.transferSyntaxUID(), uid);
        EXPECT_EQ(encoded.frames(), kFrames);
        // DCMTK's RLE knows no single bits.
        QByteArray decoded = GetParam().bitsAllocated == 1 ? allOf(DecodedPixels(again, encoded))
                                                           : pixelsByDcmtk(made, photometric);
        EXPECT_EQ(decoded.left(wanted.size()).toHex(), wanted.toHex()) << uid.constData();
        const OFString meant = sharesChroma() ? "YBR_FULL" : GetParam().photometric;
        EXPECT_TRUE(photometric == meant || GetParam().bitsAllocated == 1) << photometric;
        // Decoding here makes RGB of YBR, and leaves out what lies beside the value.
        for (const QByteArray& other : encoded.encodings()) {
            if (isYbr() || GetParam().bitsStored != GetParam().bitsAllocated)
                continue;
            decoded = pixelsByDcmtk(fileIn(other, again, encoded), photometric);
            EXPECT_EQ(decoded.left(wanted.size()).toHex(), wanted.toHex())
                << uid.constData() << " to " << other.constData();
        }
    }
}

INSTANTIATE_TEST_SUITE_P(All, EncodedKinds, testing::ValuesIn(kKinds),
                         [](const auto& each) { return each.param.name; });

}  // namespace
