#include "platform/late/LateLibrary.h"
#include "platform/volume/CompressedFrame.h"
#include "platform/volume/FrameLayout.h"
#include "platform/volume/NativeFrame.h"
#include "platform/volume/PixelTypes.h"

#include <QtEndian>

#include <dcmtk/dcmdata/dccodec.h>
#include <dcmtk/dcmdata/dcdatset.h>
#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcpixseq.h>
#include <dcmtk/dcmdata/dcpxitem.h>
#include <dcmtk/dcmjpeg/djdecode.h>
#include <dcmtk/dcmjpls/djdecode.h>

#include <algorithm>
#include <memory>

namespace Kdd
{

namespace
{

/// What a JPEG or JPEG-LS codestream says of itself before its first scan.
struct JpegHeader
{
    E_TransferSyntax xfer = EXS_Unknown;
    int precision = 0;
    int rows = 0;
    int columns = 0;
    int samples = 0;
    QByteArray sampleNames;
    bool isJfif = false;
    int adobeTransform = -1;  ///< 0 RGB, 1 YCbCr; -1 not told
};

/// A transfer syntax whose decoder takes frames of this kind.
E_TransferSyntax syntaxOfFrame(int marker)
{
    // Baseline, extended, progressive, lossless and JPEG-LS. Nothing here decodes the others, such as
    // arithmetic coding.
    switch (marker) {
    case 0xc0:
        return EXS_JPEGProcess1;
    case 0xc1:
        return EXS_JPEGProcess2_4;
    case 0xc2:
        return EXS_JPEGProcess10_12;
    case 0xc3:
        return EXS_JPEGProcess14;
    case 0xf7:
        return EXS_JPEGLSLossless;
    default:
        return EXS_Unknown;
    }
}

bool isFrameMarker(int marker)
{
    // Huffman tables, a reserved number and arithmetic conditioning have their numbers among those of frames.
    const bool isOther = marker == 0xc4 || marker == 0xc8 || marker == 0xcc;
    return marker == 0xf7 || (marker >= 0xc0 && marker <= 0xcf && !isOther);
}

/// `segment` is what follows the length field.
void readFrameHeader(int marker, const QByteArray& segment, JpegHeader& header)
{
    if (segment.size() < 6)
        return;
    header.precision = quint8(segment.at(0));
    header.rows = qFromBigEndian<quint16>(segment.constData() + 1);
    header.columns = qFromBigEndian<quint16>(segment.constData() + 3);
    header.samples = quint8(segment.at(5));
    // Three bytes for each sample, the first of which is its name.
    for (int at = 6; at < segment.size(); at += 3)
        header.sampleNames.append(segment.at(at));
    header.xfer = syntaxOfFrame(marker);
}

/// The header up to the frame segment; without a transfer syntax when there is none that can be decoded.
JpegHeader readHeader(const QByteArray& bytes)
{
    JpegHeader header;
    for (int at = 2; at + 4 <= bytes.size();) {
        if (quint8(bytes.at(at)) != 0xff)
            break;
        const int marker = quint8(bytes.at(at + 1));
        // Any number of fill bytes may stand before a marker.
        if (marker == 0xff) {
            ++at;
            continue;
        }
        const int length = qFromBigEndian<quint16>(bytes.constData() + at + 2);
        const QByteArray segment = bytes.mid(at + 4, qMax(0, length - 2));
        if (marker == 0xe0 && segment.startsWith("JFIF"))
            header.isJfif = true;
        // The transform is the last of the segment's twelve bytes.
        if (marker == 0xee && segment.startsWith("Adobe") && segment.size() >= 12)
            header.adobeTransform = quint8(segment.at(11));
        if (isFrameMarker(marker)) {
            readFrameHeader(marker, segment, header);
            break;
        }
        // At least past the length field, so that a damaged length cannot hold the walk in place.
        at += 2 + qMax(2, length);
    }
    return header;
}

/// Colour as it comes out when the decoder converts nothing. The codestream's own word counts more than the dataset's:
/// files are often relabelled and seldom recompressed.
StoredFrame::Colour colourOf(const JpegHeader& header, const FrameLayout& layout)
{
    using Colour = StoredFrame::Colour;
    if (header.adobeTransform >= 0)
        return header.adobeTransform == 0 ? Colour::Rgb : Colour::YbrFull;
    if (header.sampleNames == "RGB")
        return Colour::Rgb;
    // JFIF knows no other colours than luminance and chroma.
    return header.isJfif || layout.photometric.startsWith("YBR") ? Colour::YbrFull : Colour::Rgb;
}

/// The codecs of the process; whoever registers them first decides their settings. The list of them does not free what
/// it holds, so they leave it when the process ends.
class Codecs
{
public:
    Codecs()
    {
        DJDecoderRegistration::registerCodecs();
        DJLSDecoderRegistration::registerCodecs();
    }
    ~Codecs()
    {
        DJDecoderRegistration::cleanup();
        DJLSDecoderRegistration::cleanup();
    }
    Codecs(const Codecs&) = delete;
    Codecs& operator=(const Codecs&) = delete;
};

/// What a codec asks of the dataset. It gets one that agrees with the codestream instead of the image's own, which may
/// not; RGB keeps it from converting colour.
void describe(const JpegHeader& header, int bits, DcmItem& item)
{
    item.putAndInsertUint16(DCM_SamplesPerPixel, static_cast<Uint16>(header.samples));
    item.putAndInsertString(DCM_PhotometricInterpretation, header.samples == 1 ? "MONOCHROME2" : "RGB");
    item.putAndInsertUint16(DCM_PlanarConfiguration, 0);
    item.putAndInsertString(DCM_NumberOfFrames, "1");
    item.putAndInsertUint16(DCM_Rows, static_cast<Uint16>(header.rows));
    item.putAndInsertUint16(DCM_Columns, static_cast<Uint16>(header.columns));
    item.putAndInsertUint16(DCM_BitsAllocated, static_cast<Uint16>(bits));
    item.putAndInsertUint16(DCM_BitsStored, static_cast<Uint16>(header.precision));
    item.putAndInsertUint16(DCM_HighBit, static_cast<Uint16>(header.precision - 1));
    item.putAndInsertUint16(DCM_PixelRepresentation, 0);
}

std::unique_ptr<DcmPixelSequence> sequenceOf(const QByteArray& bytes)
{
    auto sequence = std::make_unique<DcmPixelSequence>(DcmTag(DCM_PixelData, EVR_OB));
    // Fragments have even lengths.
    QByteArray even = bytes;
    even.append(bytes.size() % 2, 0);
    auto* fragment = new DcmPixelItem(DcmTag(DCM_Item, EVR_OB));
    fragment->putUint8Array(reinterpret_cast<const Uint8*>(even.constData()),
                            static_cast<Uint32>(even.size()));
    // An empty offset table, with which every sequence begins.
    sequence->insert(new DcmPixelItem(DcmTag(DCM_Item, EVR_OB)));
    sequence->insert(fragment);
    return sequence;
}

OFCondition decode(const QByteArray& bytes, const JpegHeader& header, TypedData2D& pixels)
{
    static const Codecs kCodecs;
    DcmDataset item;
    describe(header, 8 * sizeOf(pixels.type), item);
    const auto sequence = sequenceOf(bytes);
    const auto size = static_cast<int>(pixels.rowStride() * pixels.height);
    // The decoder asks for room of an even number of bytes.
    pixels.pixels = QByteArray(size + size % 2, 0);
    Uint32 fragment = 1;
    OFString colour;
    const OFCondition decoded =
        DcmCodecList::decodeFrame(DcmXfer(header.xfer), nullptr, sequence.get(), &item, 0, fragment,
                                  pixels.pixels.data(), static_cast<Uint32>(pixels.pixels.size()), colour);
    pixels.pixels.truncate(size);
    return decoded;
}

/// Codestreams of few bits in pixels of many.
void widen(TypedData2D& pixels, const FrameLayout& layout)
{
    TypedData2D wide = layout.allocate();
    visitPixelType(wide.type, [&](auto zero) {
        using To = decltype(zero);
        visitPixelType(pixels.type, [&](auto from) {
            const auto* values = valuesOf<decltype(from)>(pixels);
            std::transform(values, values + numValues(pixels), valuesOf<To>(wide),
                           [](auto value) { return static_cast<To>(value); });
        });
    });
    pixels = wide;
}

}  // namespace

Result decodeJpeg(const QByteArray& bytes, const FrameLayout& layout, StoredFrame& out)
{
    const JpegHeader header = readHeader(bytes);
    if (header.xfer == EXS_Unknown)
        return Result::failure(QStringLiteral("JPEG data of a kind that cannot be decoded"));
    Result fits = checkCodestream(layout, header.columns, header.rows, header.samples, header.precision);
    if (fits.good())
        fits = loadLate(LateLibrary::Codecs);
    if (fits.bad())
        return fits;
    const auto type = header.precision > 8 ? PrimitiveType::UInt16 : PrimitiveType::UInt8;
    out.pixels = TypedData2D{layout.columns, layout.rows, layout.samples, type, {}};
    const OFCondition decoded = decode(bytes, header, out.pixels);
    if (decoded.bad())
        return Result::failure(QStringLiteral("JPEG data cannot be decoded: ") +
                               QLatin1String(decoded.text()));
    if (layout.samples == 3)
        out.colour = colourOf(header, layout);
    if (out.pixels.pixels.size() < layout.frameBytes())
        widen(out.pixels, layout);
    // The codec was told of unsigned pixels; the sign is what the dataset says.
    out.pixels.type = layout.type();
    const int bits = qMin(header.precision, layout.bitsStored);
    keepStoredBits(out.pixels, bits, bits - 1);
    return Result();
}

}  // namespace Kdd
