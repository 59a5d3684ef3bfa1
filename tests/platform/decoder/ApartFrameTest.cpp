#include "DecoderFixture.h"
#include "platform/decoder/DecoderPlace.h"
#include "platform/volume/CompressedFrame.h"
#include "platform/volume/FragmentReader.h"
#include "platform/volume/FrameEncoding.h"
#include "support/DatasetBuilder.h"
#include "support/RealFiles.h"
#include "support/Setting.h"
#include "support/Threads.h"

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcfilefo.h>

#include <random>

using namespace Kdd;

namespace
{

using ApartFrames = Decoders;

struct CompressedPixels
{
    QByteArray bytes;
    FrameLayout layout;
};

QString textOf(const Result& result, const StoredFrame& frame)
{
    const TypedData2D& pixels = frame.pixels;
    return result.text() + QStringLiteral(" %1x%2x%3 of %4, colour %5, halved %6")
                               .arg(pixels.width)
                               .arg(pixels.height)
                               .arg(pixels.components)
                               .arg(int(pixels.type))
                               .arg(int(frame.colour))
                               .arg(frame.reduction);
}

/// Whether both ways lead to the same.
void compare(DecoderPool& pool, const CompressedPixels& one, int least, const char* name)
{
    StoredFrame inside;
    StoredFrame apart;
    inside.colour = apart.colour = StoredFrame::Colour::Palette;
    const Result here = decodeCodestream(one.bytes, one.layout, least, inside);
    const Result there = decodeFrameApart(pool, one.bytes, one.layout, least, apart);
    // What failed is not used, whatever it has become.
    if (here.bad())
        inside = apart;
    EXPECT_EQ(textOf(there, apart).toStdString(), textOf(here, inside).toStdString()) << name;
    EXPECT_TRUE(apart.pixels.pixels == inside.pixels.pixels) << name;
}

/// The JPEG and JPEG 2000 among the first frames of a file.
QVector<CompressedPixels> codestreamsOf(const QString& path)
{
    constexpr int kMost = 3;
    QVector<CompressedPixels> found;
    DcmFileFormat file;
    DcmElement* element = nullptr;
    FrameLayout layout;
    E_TransferSyntax xfer = EXS_Unknown;
    if (file.loadFile(qPrintable(path)).bad() ||
        file.getDataset()->findAndGetElement(DCM_PixelData, element).bad() ||
        readFrameLayout(*file.getDataset(), layout).bad())
        return found;
    DcmPixelSequence* fragments = findFragments(*element, xfer);
    for (int i = 0; fragments != nullptr && !isVideo(xfer) && i < qMin(kMost, layout.frames); ++i) {
        QByteArray bytes;
        const bool isRead = readFrameBytes(*fragments, i, layout.frames, bytes).good();
        const Codestream kind = recognizeCodestream(bytes);
        if (isRead && (kind == Codestream::Jpeg || kind == Codestream::Jpeg2000))
            found.append({bytes, layout});
    }
    return found;
}

QVector<CompressedPixels> encodedFrames()
{
    QVector<CompressedPixels> frames;
    for (const int samples : {1, 3}) {
        for (const int bits : {8, 16}) {
            FrameLayout layout;
            layout.rows = 31;
            layout.columns = 17;
            layout.samples = samples;
            layout.bitsAllocated = layout.bitsStored = bits;
            layout.highBit = bits - 1;
            layout.isSigned = samples == 1;
            layout.photometric = samples == 1 ? "MONOCHROME2" : "RGB";
            QByteArray pixels(static_cast<int>(layout.frameBytes()), 0);
            std::mt19937 random(1);  // NOLINT(cert-msc51-cpp): the same pixels every time
            for (char& each : pixels)
                each = static_cast<char>(random());
            for (const FrameCoding coding : {FrameCoding::JpegLossless, FrameCoding::JpegLs}) {
                CompressedPixels one = {{}, layout};
                EXPECT_TRUE(encodeFrame(coding, pixels, layout, one.bytes).good());
                frames.append(one);
            }
        }
    }
    return frames;
}

TEST_F(ApartFrames, AreTheSameForWhatWasEncodedHere)
{
    DecoderPool pool(KDD_DECODER_FILE);
    for (const CompressedPixels& one : encodedFrames())
        compare(pool, one, 0, "encoded here");
    // Not one died on the way.
    EXPECT_EQ(pool.count(), 1);
}

TEST_F(ApartFrames, AreTheSameForEveryRealFile)
{
    if (realFilesFolder().isEmpty())
        GTEST_SKIP() << "KDD_TEST_DATA names no folder of real files";
    DecoderPool pool(KDD_DECODER_FILE);
    int count = 0;
    for (const char* folder : {"transfer-syntaxes", "modalities", "multiframe"}) {
        for (const QString& path : realFiles(folder)) {
            for (const CompressedPixels& one : codestreamsOf(path)) {
                compare(pool, one, 0, qPrintable(path));
                compare(pool, one, 64, qPrintable(path));
                ++count;
            }
        }
    }
    EXPECT_GT(count, 60) << "frames that are compressed";
}

TEST_F(ApartFrames, AreTheSameWhenTheyAreDamaged)
{
    DecoderPool pool(KDD_DECODER_FILE);
    std::mt19937 random(2);  // NOLINT(cert-msc51-cpp): the same damage every time
    for (const CompressedPixels& one : encodedFrames()) {
        for (int i = 0; i < 40; ++i) {
            CompressedPixels damaged = one;
            // Most of it in the header, where the sizes are.
            const auto at = int(random() % unsigned(i % 4 ? 60 : one.bytes.size()));
            damaged.bytes[at] = static_cast<char>(damaged.bytes.at(at) ^ (1 << random() % 8));
            compare(pool, damaged, 0, "damaged");
        }
        compare(pool, {one.bytes.left(one.bytes.size() / 2), one.layout}, 0, "cut");
        compare(pool, {{}, one.layout}, 0, "empty");
    }
}

TEST_F(ApartFrames, AreDecodedOnManyThreads)
{
    DecoderPool pool(KDD_DECODER_FILE);
    const QVector<CompressedPixels> frames = encodedFrames();
    onThreads(8, [&](int thread) {
        for (int i = 0; i < 20; ++i)
            compare(pool, frames.at((thread + i) % frames.size()), 0, "in parallel");
    });
}

TEST_F(ApartFrames, TakeWhatTheSettingSays)
{
    EXPECT_EQ(decoderPlace(), DecoderPlace::Inside);
    setDecoderPlace(DecoderPlace::Apart);
    EXPECT_EQ(decoderPlace(), DecoderPlace::Apart);
    {
        const Setting setting("KDD_DECODER", "inside");
        EXPECT_EQ(decoderPlace(), DecoderPlace::Inside);
    }
    setDecoderPlace(DecoderPlace::Inside);
    for (const char* text : {"apart", "Inside"}) {
        const Setting setting("KDD_DECODER", text);
        EXPECT_EQ(decoderPlace(), DecoderPlace::Apart) << text;
    }
}

}  // namespace
