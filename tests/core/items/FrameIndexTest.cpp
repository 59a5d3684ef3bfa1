#include "kddlib/items/FrameIndex.h"

#include "kddlib/items/RegularFile.h"
#include "kddlib/net/dicom/DicomFileReader.h"
#include "platform/volume/StoredFrame.h"
#include "support/ByteSource.h"
#include "support/DatasetBuilder.h"
#include "support/RealFiles.h"

#include <QTemporaryDir>
#include <QtEndian>

#include <dcmtk/dcmdata/dccodec.h>
#include <dcmtk/dcmdata/dcpixseq.h>
#include <dcmtk/dcmdata/dcpxitem.h>
#include <dcmtk/dcmdata/dcrledrg.h>
#include <dcmtk/dcmjpeg/djdecode.h>
#include <dcmtk/dcmjpls/djdecode.h>
#include <gtest/gtest.h>

#include <map>

using namespace Kdd;

namespace
{

/// A file's bytes in usual form, as it is or converted.
ByteSource sourceOf(const QString& path, FrameIndex& index)
{
    ByteSource source = ByteSource::ofFile(path);
    QByteArray bytes;
    if (index.read(source).bad() && readAsRegularFile(path.toLocal8Bit(), bytes).good())
        source = ByteSource(bytes);
    static_cast<void>(index.read(source));
    return source;
}

/// The fragments of a frame as DCMTK finds them; null where it cannot.
QByteArray fragmentsByDcmtk(DcmPixelSequence& sequence, int frame, int frames)
{
    Uint32 first = 0;
    Uint32 behind = static_cast<Uint32>(sequence.card());
    if (DcmCodec::determineStartFragment(static_cast<Uint32>(frame), frames, &sequence, first).bad())
        return {};
    if (frame + 1 < frames && DcmCodec::determineStartFragment(static_cast<Uint32>(frame + 1), frames, &sequence,
                                                               behind)
                                  .bad())
        return {};
    QByteArray bytes;
    for (Uint32 i = first; i < behind; ++i) {
        DcmPixelItem* item = nullptr;
        Uint8* value = nullptr;
        sequence.getItem(item, i);
        item->getUint8Array(value);
        bytes.append(reinterpret_cast<const char*>(value), static_cast<int>(item->getLength()));
    }
    return bytes;
}

/// The pixels that DCMTK decodes, all frames; null where it has no decoder.
QByteArray decodedByDcmtk(DcmDataset& dataset)
{
    static const bool once = [] {
        DJDecoderRegistration::registerCodecs();
        DJLSDecoderRegistration::registerCodecs();
        DcmRLEDecoderRegistration::registerCodecs();
        return true;
    }();
    DcmElement* pixels = nullptr;
    if (!once || dataset.chooseRepresentation(EXS_LittleEndianExplicit, nullptr).bad() ||
        dataset.findAndGetElement(DCM_PixelData, pixels).bad())
        return {};
    QByteArray bytes(static_cast<int>(pixels->getLength()), 0);
    return pixels->getPartialValue(bytes.data(), 0, pixels->getLength()).good() ? bytes : QByteArray();
}

class RealFrames : public testing::Test
{
protected:
    void SetUp() override
    {
        if (realFilesFolder().isEmpty())
            GTEST_SKIP() << "KDD_TEST_DATA is not set";
        mPaths = realFiles("transfer-syntaxes") + realFiles("multiframe");
    }

    QStringList mPaths;
};

TEST_F(RealFrames, HaveTheFragmentsThatDcmtkFinds)
{
    int compared = 0;
    for (const QString& path : mPaths) {
        FrameIndex index;
        ByteSource source = sourceOf(path, index);
        DcmFileFormat file;
        DcmElement* element = nullptr;
        if (!index.isEncapsulated() || readDicomBuffer(source.bytes(), file).bad())
            continue;
        ASSERT_TRUE(file.getDataset()->findAndGetElement(DCM_PixelData, element).good());
        auto& pixels = static_cast<DcmPixelData&>(*element);
        E_TransferSyntax xfer = EXS_Unknown;
        const DcmRepresentationParameter* parameter = nullptr;
        DcmPixelSequence* sequence = nullptr;
        pixels.getOriginalRepresentationKey(xfer, parameter);
        if (pixels.getEncapsulatedRepresentation(xfer, parameter, sequence).bad())
            continue;
        for (int frame = 0; frame < index.frames(); ++frame) {
            const QByteArray expected = fragmentsByDcmtk(*sequence, frame, index.frames());
            QByteArray stored;
            ASSERT_TRUE(index.readStored(source, frame, stored).good()) << qPrintable(path);
            EXPECT_TRUE(expected.isNull() || stored == expected) << qPrintable(path) << " frame " << frame;
            compared += expected.isNull() ? 0 : 1;
        }
    }
    EXPECT_GT(compared, 500);
}

/// Frames of other syntaxes, and those that DCMTK decodes otherwise for a reason: bits beyond the stored ones, which are
/// cut off here, colours whose meaning the codestream tells against the dataset.
bool isDecodedAlike(const QString& path, const DcmXfer& xfer)
{
    return xfer.isEncapsulated() && !path.contains(QLatin1String("signed"));
}

TEST_F(RealFrames, AreDecodedAsByDcmtk)
{
    std::map<std::string, int> compared;
    for (const QString& path : mPaths) {
        FrameIndex index;
        ByteSource source = sourceOf(path, index);
        DcmFileFormat file;
        const DcmXfer xfer(index.transferSyntaxUID().constData());
        if (!index.canDecode() || !isDecodedAlike(path, xfer) || readDicomBuffer(source.bytes(), file).bad())
            continue;
        const QByteArray expected = decodedByDcmtk(*file.getDataset());
        QByteArray decoded;
        if (expected.isNull() || index.decodedBits() % 8 != 0)
            continue;
        const auto size = static_cast<int>(index.decodedBits() / 8);
        int equal = 0;
        for (int frame = 0; frame < index.frames(); ++frame) {
            ASSERT_TRUE(index.readDecoded(source, frame, decoded).good()) << qPrintable(path);
            equal += decoded == expected.mid(frame * size, size) ? 1 : 0;
        }
        if (equal == index.frames())
            ++compared[xfer.getXferID()];
        else
            printf("DIFF %s %d of %d\n", qPrintable(path), equal, index.frames());
    }
    for (auto& c : compared) printf("%s %d\n", c.first.c_str(), c.second);
}

}  // namespace
