#include "platform/volume/FrameEncoding.h"

#include "platform/late/LateLibrary.h"
#include "platform/volume/FrameLayout.h"
#include "platform/volume/jpegls/JpegLsEncoder.h"

#include <QtEndian>

#include <dcmtk/dcmdata/dccodec.h>
#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcitem.h>
#include <dcmtk/dcmdata/dcpixel.h>
#include <dcmtk/dcmdata/dcpixseq.h>
#include <dcmtk/dcmdata/dcpxitem.h>
#include <dcmtk/dcmdata/dcrleenc.h>
#include <dcmtk/dcmdata/dcstack.h>
#include <dcmtk/dcmjpeg/djcparam.h>
#include <dcmtk/dcmjpeg/djeijg16.h>
#include <dcmtk/dcmjpeg/djeijg8.h>
#include <dcmtk/dcmjpls/djcparam.h>
#include <dcmtk/dcmjpls/djrparam.h>

#include <memory>

namespace Kdd
{

namespace
{

constexpr int kRleHeader = 64;

Result refused(const char* what, const OFCondition& condition)
{
    return Result::failure(QStringLiteral("A frame cannot be compressed as %1: %2")
                               .arg(QLatin1String(what), QLatin1String(condition.text())));
}

bool isYbr(const FrameLayout& layout)
{
    return layout.samples == 3 && layout.photometric.startsWith("YBR");
}

/// Every `step`th byte from `at` on.
Result appendSegment(const QByteArray& pixels, int at, int step, int rowBytes, QByteArray& bytes)
{
    DcmRLEEncoder encoder(OFTrue);
    int column = 0;
    for (int i = at; i < pixels.size(); i += step) {
        encoder.add(static_cast<unsigned char>(pixels.at(i)));
        // No run goes from one row into the next.
        if (++column == rowBytes) {
            encoder.flush();
            column = 0;
        }
    }
    encoder.flush();
    if (encoder.fail())
        return refused("RLE", EC_MemoryExhausted);
    const int start = bytes.size();
    bytes.resize(start + static_cast<int>(encoder.size()));
    encoder.write(bytes.data() + start);
    return {};
}

/// Each byte of each sample is a segment of its own, the highest byte first.
Result encodeRle(const QByteArray& pixels, const FrameLayout& layout, QByteArray& bytes)
{
    const int width = qMax(1, layout.bitsAllocated / 8);
    const int step = width * layout.samples;
    // Rows of single bits do not begin at bytes, so these are one row.
    const int rowBytes = layout.bitsAllocated == 1 ? pixels.size() : layout.columns;
    bytes = QByteArray(kRleHeader, 0);
    qToLittleEndian<quint32>(static_cast<quint32>(step), bytes.data());
    Result result;
    for (int i = 0; i < step && result.good(); ++i) {
        qToLittleEndian<quint32>(static_cast<quint32>(bytes.size()), bytes.data() + 4 * (i + 1));
        const int at = i / width * width + width - 1 - i % width;
        result = appendSegment(pixels, at, step, rowBytes, bytes);
    }
    return result;
}

Result encodeJpegLossless(QByteArray pixels, const FrameLayout& layout, QByteArray& bytes)
{
    const DJCodecParameter parameters(ECC_lossyYCbCr, EDC_never, EUC_never, EPC_default);
    const auto columns = static_cast<Uint16>(layout.columns);
    const auto rows = static_cast<Uint16>(layout.rows);
    const auto samples = static_cast<Uint16>(layout.samples);
    EP_Interpretation colour = EPI_Monochrome2;
    if (layout.samples == 3)
        colour = isYbr(layout) ? EPI_YBR_Full : EPI_RGB;
    Uint8* made = nullptr;
    Uint32 length = 0;
    OFCondition condition;
    if (layout.bitsAllocated == 8) {
        DJCompressIJG8Bit encoder(parameters, EJM_lossless, 1, 0);
        condition = encoder.encode(columns, rows, colour, samples, reinterpret_cast<Uint8*>(pixels.data()),
                                   made, length);
    } else {
        DJCompressIJG16Bit encoder(parameters, EJM_lossless, 1, 0);
        condition = encoder.encode(columns, rows, colour, samples, reinterpret_cast<Uint16*>(pixels.data()),
                                   made, length);
    }
    const std::unique_ptr<Uint8[]> owned(made);
    if (condition.bad() || made == nullptr)
        return refused("JPEG", condition);
    bytes = QByteArray(reinterpret_cast<const char*>(made), static_cast<int>(length));
    return {};
}

/// What the codec asks of the dataset. It gets all allocated bits as stored ones: it does not survive values that are
/// larger than it was told.
void describe(const FrameLayout& layout, DcmItem& item)
{
    const auto bits = static_cast<Uint16>(layout.bitsAllocated);
    item.putAndInsertUint16(DCM_SamplesPerPixel, static_cast<Uint16>(layout.samples));
    item.putAndInsertString(DCM_PhotometricInterpretation, layout.samples == 1 ? "MONOCHROME2" : "RGB");
    item.putAndInsertUint16(DCM_PlanarConfiguration, 0);
    item.putAndInsertString(DCM_NumberOfFrames, "1");
    item.putAndInsertUint16(DCM_Rows, static_cast<Uint16>(layout.rows));
    item.putAndInsertUint16(DCM_Columns, static_cast<Uint16>(layout.columns));
    item.putAndInsertUint16(DCM_BitsAllocated, bits);
    item.putAndInsertUint16(DCM_BitsStored, bits);
    item.putAndInsertUint16(DCM_HighBit, static_cast<Uint16>(bits - 1));
    item.putAndInsertUint16(DCM_PixelRepresentation, 0);
}

Result encodeJpegLs(QByteArray pixels, const FrameLayout& layout, QByteArray& bytes)
{
    const DJLSRepresentationParameter wanted;
    const DJLSCodecParameter parameters(OFFalse, 0, 0, 0, 0, 0, OFFalse, EJLSUC_never);
    DcmItem item;
    describe(layout, item);
    auto* element = new DcmPixelData(DcmTag(DCM_PixelData, EVR_OW));
    item.insert(element);
    DcmStack place;
    place.push(&item);
    place.push(element);
    const auto length = static_cast<Uint32>(pixels.size());
    pixels.append(pixels.size() % 2, '\0');
    DcmPixelSequence* made = nullptr;
    OFBool isReplaced = OFFalse;
    const OFCondition condition =
        jpegLsEncoder().encode(reinterpret_cast<const Uint16*>(pixels.constData()), length, &wanted, made,
                               &parameters, place, isReplaced);
    const std::unique_ptr<DcmPixelSequence> owned(made);
    DcmPixelItem* fragment = nullptr;
    Uint8* value = nullptr;
    // The first item is the offset table.
    if (condition.bad() || made == nullptr || made->card() != 2 || made->getItem(fragment, 1).bad() ||
        fragment->getUint8Array(value).bad() || value == nullptr)
        return refused("JPEG-LS", condition.bad() ? condition : EC_CorruptedData);
    bytes = QByteArray(reinterpret_cast<const char*>(value), static_cast<int>(fragment->getLength()));
    return {};
}

}  // namespace

bool canEncode(FrameCoding coding, const FrameLayout& layout)
{
    const int bits = layout.bitsAllocated;
    const bool isWhole = bits == 8 || bits == 16;
    const bool isRle = coding == FrameCoding::Rle && (bits == 32 || (bits == 1 && layout.samples == 1));
    if (layout.isFloat || !(isWhole || isRle))
        return false;
    // The standard has no name for what other colours would be when their chroma is not shared any more.
    return layout.samples == 1 || layout.photometric == "RGB" || layout.photometric == "YBR_FULL" ||
           layout.photometric == "YBR_FULL_422";
}

Result encodeFrame(FrameCoding coding, const QByteArray& pixels, const FrameLayout& layout, QByteArray& bytes)
{
    const qint64 size = layout.bitsAllocated == 1 ? (layout.numValues() + 7) / 8 : layout.frameBytes();
    if (!canEncode(coding, layout) || pixels.size() != size)
        return Result::failure(QStringLiteral("Pixels of %1 bits and %2 bytes cannot be compressed")
                                   .arg(layout.bitsAllocated)
                                   .arg(pixels.size()));
    const Result loaded = coding == FrameCoding::Rle ? Result() : loadLate(LateLibrary::Codecs);
    if (loaded.bad())
        return loaded;
    switch (coding) {
    case FrameCoding::JpegLossless:
        return encodeJpegLossless(pixels, layout, bytes);
    case FrameCoding::JpegLs:
        return encodeJpegLs(pixels, layout, bytes);
    case FrameCoding::Rle:
        break;
    }
    return encodeRle(pixels, layout, bytes);
}

}  // namespace Kdd
