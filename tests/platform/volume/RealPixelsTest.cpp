#include "Pixels.h"
#include "platform/volume/FragmentReader.h"
#include "support/RealImage.h"

#include <dcmtk/dcmdata/dcpixseq.h>
#include <dcmtk/dcmdata/dcpxitem.h>
#include <dcmtk/dcmdata/dcrledrg.h>
#include <dcmtk/dcmimage/diregist.h>
#include <dcmtk/dcmimgle/dcmimage.h>
#include <gtest/gtest.h>

#include <cmath>
#include <random>

using namespace Kdd;

namespace
{

std::unique_ptr<DcmFileFormat> load(const QString& path)
{
    auto file = std::make_unique<DcmFileFormat>();
    EXPECT_TRUE(file->loadFile(qPrintable(path), EXS_Unknown, EGL_noChange, 4096).good()) << qPrintable(path);
    return file;
}

QString inTransferSyntaxes(const char* name)
{
    return realFilesFolder() + QLatin1String("/transfer-syntaxes/") + QLatin1String(name);
}

using RealPixels = RealImages;

/// The same image in several transfer syntaxes without loss, and a frame of it.
const std::tuple<int, std::vector<const char*>> kTwins[] = {
    {0,
     {"explicit-le/CT1_UNC.explicit_little_endian.dcm", "explicit-be/CT1_UNC.explicit_big_endian.dcm",
      "implicit-le/CT1_UNC.implicit_little_endian.dcm", "jpeg-lossless-sv1-70/CT1_JPLL", "rle/CT1_RLE",
      "jpeg-ls-80/CT1_UNC.fragmented_bot_jpeg_ls.80.dcm",
      "jpeg-ls-80/CT1_UNC.fragmented_no_bot_jpeg_ls.80.dcm",
      "jpeg-ls-80/CT1_UNC.not_fragmented_bot_jpeg_ls.80.dcm"}},
    {0,
     {"explicit-le/MR_small.dcm", "explicit-be/MR_small_bigendian.dcm", "implicit-le/MR_small_implicit.dcm",
      "rle/MR_small_RLE.dcm", "jpeg-ls-80/MR_small_jpeg_ls_lossless.dcm",
      "jpeg2000-lossless-90/MR_small_jp2klossless.dcm"}},
    {7,
     {"explicit-be/emri_small_big_endian.dcm", "rle/emri_small_RLE.dcm",
      "jpeg-ls-80/emri_small_jpeg_ls_lossless.dcm", "jpeg2000-lossless-90/emri_small_jpeg_2k_lossless.dcm"}},
    {1,
     {"jpeg-ls-80/CT0012.fragmented_no_bot_jpeg_ls.80.dcm",
      "jpeg-ls-80/CT0012.not_fragmented_bot_jpeg_ls.80.dcm",
      "jpeg-lossless-57/CT0012.fragmented_no_bot_jpeg_lossless.57.dcm",
      "rle/CT0012.not_fragmented_no_bot_rle.dcm"}},
    {1, {"explicit-be/SC_rgb_expb_16bit_2frame.dcm", "rle/SC_rgb_rle_16bit_2frame.dcm"}},
    {0, {"explicit-le/SC_rgb_32bit.dcm", "rle/SC_rgb_rle_32bit.dcm"}},
    {0, {"explicit-be/rtdose_expb_1frame.dcm", "../odd/vr/badVR.dcm"}},
    {7, {"rle/rtdose_rle.dcm", "../multiframe/rtdose/rtdose.dcm"}},
    {0, {"explicit-le/SC_rgb_small_odd.dcm", "explicit-be/SC_rgb_small_odd_big_endian.dcm"}},
    {0, {"jpeg-ls-80/JLSL_RGB_ILV0.dcm", "jpeg-ls-80/JLSL_RGB_ILV1.dcm", "jpeg-ls-80/JLSL_RGB_ILV2.dcm"}},
    {2,
     {"../multiframe/seg/liver.dcm", "deflated-image-frame/liver_deflate.dcm", "rle/liver_rle.dcm",
      "jpeg2000-lossless-90/liver_j2k.dcm"}},
    {1,
     {"../multiframe/seg/liver_nonbyte_aligned.dcm",
      "deflated-image-frame/liver_nonbyte_aligned_deflate.dcm"}},
};

TEST_F(RealPixels, AreTheSameInEveryLosslessTransferSyntax)
{
    for (const auto& [frame, files] : kTwins) {
        StoredFrame first;
        for (const char* name : files) {
            const auto file = load(inTransferSyntaxes(name));
            StoredFrame stored;
            const Result result = readStoredFrame(*file->getDataset(), frame, 0, stored);
            ASSERT_TRUE(result.good()) << name << ": " << qPrintable(result.text());
            if (first.pixels.isEmpty())
                first = stored;
            EXPECT_EQ(stored.pixels.width, first.pixels.width) << name;
            EXPECT_TRUE(stored.pixels.pixels == first.pixels.pixels) << name;
        }
    }
}

TEST_F(RealPixels, EveryImageGivesAPictureOrSaysWhyNot)
{
    int pictures = 0;
    for (const char* folder : {"transfer-syntaxes", "modalities", "multiframe"}) {
        for (const QString& path : realFiles(folder)) {
            const auto file = load(path);
            Result result;
            const auto info = KxVolumeInfo::readVolumeInfo(file->getDataset(), 64, 64, path, result);
            const bool hasPixels = file->getDataset()->tagExists(DCM_PhotometricInterpretation);
            const char* reason = path.endsWith(QLatin1String("will-jxl.dcm"))
                                     ? ": There is no decoder for JPEG XL"
                                 : hasPixels ? nullptr
                                             : ": There are no pixel data";
            const QString text = reason ? path + QLatin1String(reason) : QString();
            EXPECT_STREQ(qPrintable(result.text()), qPrintable(text));
            EXPECT_EQ(info && info->previewHasPixels(), reason == nullptr) << qPrintable(path);
            pictures += info ? 1 : 0;
        }
    }
    EXPECT_GT(pictures, 140);
}

/// The mean difference between our colours and those of DCMTK's rendering, on a scale of 255.
double differenceFromRendering(DcmDataset& dataset, const KxVolumeInfo& ours)
{
    DicomImage theirs(&dataset, dataset.getOriginalXfer(), CIF_UsePartialAccessToPixelData,
                      static_cast<unsigned long>(numberOfFrames(dataset) / 2), 1);
    const auto* rendered = static_cast<const Uint8*>(theirs.getOutputData(8));
    const QVector<double> numbers = numbersOf(ours);
    const double scale = 255 / double(ours.highestValue());
    double sum = rendered ? 0 : 1e9;
    for (int i = 0; rendered && i < numbers.size(); ++i)
        sum += std::abs(numbers.at(i) * scale - rendered[i]);
    return sum / numbers.size();
}

/// A file, and the one that shows what it must look like where that is another one.
const char* const kColourFiles[][2] = {
    {"explicit-le/SC_ybr_full_uncompressed.dcm"},
    {"explicit-le/SC_ybr_full_422_uncompressed.dcm"},
    {"explicit-le/color-pl.dcm"},
    {"jpeg-baseline-50/SC_rgb_dcmtk_+eb+cr.dcm"},
    {"jpeg-baseline-50/TestPattern_JPEG-Baseline_YBRFull.dcm"},
    {"jpeg-lossless-sv1-70/TestPattern_JPEG-Lossless_RGB.dcm"},
    {"jpeg-ls-near-81/SC_rgb_jls_lossy_sample.dcm"},
    {"../modalities/ot/TestPattern_Palette_16.dcm"},
    {"../multiframe/us/examples_ybr_color.dcm"},
    {"jpeg2000-lossless-90/examples_jpeg2k.dcm", "rle/US1_RLE"},
    {"jpeg2000-91/SC_rgb_gdcm_KY.dcm", "rle/SC_rgb_rle.dcm"},
    {"jpeg2000-91/US1_J2KI.dcm", "rle/US1_RLE"},
};

TEST_F(RealPixels, HaveTheColoursThatAnotherDecoderShows)
{
    DcmRLEDecoderRegistration::registerCodecs();
    for (const auto& [name, reference] : kColourFiles) {
        const auto file = load(inTransferSyntaxes(name));
        const auto shown = load(inTransferSyntaxes(reference ? reference : name));
        Result result;
        const auto info = KxVolumeInfo::readVolumeInfo(file->getDataset(), 0, 0, QString(), result);
        ASSERT_TRUE(info) << name << qPrintable(result.text());
        EXPECT_LT(differenceFromRendering(*shown->getDataset(), *info), reference ? 4 : 1.5) << name;
    }
    DcmRLEDecoderRegistration::cleanup();
}

/// A dataset of one frame, and the bytes of its fragment to damage.
struct Damageable
{
    explicit Damageable(const char* name)
        : file(load(inTransferSyntaxes(name)))
    {
        DcmElement* element = nullptr;
        E_TransferSyntax xfer = EXS_Unknown;
        file->getDataset()->findAndGetElement(DCM_PixelData, element);
        findFragments(*element, xfer)->getItem(fragment, 1);
        bytes.resize(static_cast<int>(fragment->getLengthField()));
        fragment->getPartialValue(bytes.data(), 0, fragment->getLengthField());
    }

    /// Whether a frame comes out of these bytes; if so it must be whole.
    bool decodes(const QByteArray& damaged)
    {
        fragment->putUint8Array(reinterpret_cast<const Uint8*>(damaged.constData()),
                                static_cast<unsigned long>(damaged.size()));
        StoredFrame stored;
        const bool isGood = readStoredFrame(*file->getDataset(), 0, 0, stored).good();
        EXPECT_TRUE(!isGood ||
                    stored.pixels.pixels.size() == stored.pixels.rowStride() * stored.pixels.height);
        return isGood;
    }

    std::unique_ptr<DcmFileFormat> file;
    DcmPixelItem* fragment = nullptr;
    QByteArray bytes;
};

const char* const kDamaged[] = {"jpeg-baseline-50/SC_rgb_small_odd_jpeg.dcm",
                                "jpeg-ls-80/MR_small_jpeg_ls_lossless.dcm",
                                "jpeg2000-lossless-90/MR_small_jp2klossless.dcm", "rle/MR_small_RLE.dcm",
                                "jpeg-lossless-57/CT0012.fragmented_no_bot_jpeg_lossless.57.dcm"};

TEST_F(RealPixels, SurviveDamage)
{
    std::mt19937 random(1);  // NOLINT(cert-msc51-cpp): the same damage every time
    for (const char* name : kDamaged) {
        Damageable image(name);
        const int size = image.bytes.size();
        for (int length = 2; length < size; length += 1 + size / 60)
            image.decodes(image.bytes.left(length & ~1));
        for (int i = 0; i < 200; ++i) {
            QByteArray damaged = image.bytes;
            // Half of the damage goes to the header, where the sizes are.
            const int reach = i % 2 ? size : qMin(size, 200);
            for (int flip = 0; flip < 3; ++flip) {
                const auto at = static_cast<int>(random() % unsigned(reach));
                damaged[at] = static_cast<char>(damaged.at(at) ^ (1 << random() % 8));
            }
            image.decodes(damaged);
        }
        EXPECT_FALSE(image.decodes(image.bytes.left(40))) << name;
    }
}

TEST_F(RealPixels, ACodestreamOfAnotherSizeIsRefused)
{
    const auto file = load(inTransferSyntaxes("jpeg2000-lossless-90/MR_small_jp2klossless.dcm"));
    file->getDataset()->putAndInsertUint16(DCM_Rows, 4096);
    StoredFrame stored;
    EXPECT_STREQ(qPrintable(readStoredFrame(*file->getDataset(), 0, 0, stored).text()),
                 "A codestream of 64 x 64 x 1 values of 16 bits does not fit an image of 64 x 4096 x 1 "
                 "values of 16 bits");
}

}  // namespace
