#include "kddlib/items/FrameIndexData.h"
#include "platform/volume/CompressedFrame.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcxfer.h>

namespace Kdd
{

namespace
{

/// Of those that decodeFrame has a decoder for. What it would have none for is told before bytes are sent.
constexpr const char* kDecoded[] = {
    "1.2.840.10008.1.2.4.50",  "1.2.840.10008.1.2.4.51", "1.2.840.10008.1.2.4.53",  "1.2.840.10008.1.2.4.55",
    "1.2.840.10008.1.2.4.57",  "1.2.840.10008.1.2.4.70", "1.2.840.10008.1.2.4.80",  "1.2.840.10008.1.2.4.81",
    "1.2.840.10008.1.2.4.90",  "1.2.840.10008.1.2.4.91", "1.2.840.10008.1.2.4.201", "1.2.840.10008.1.2.4.202",
    "1.2.840.10008.1.2.4.203", "1.2.840.10008.1.2.5",    "1.2.840.10008.1.2.8.1",
};

constexpr qint64 fixed(double factor)
{
    return static_cast<qint64>(factor * 65536 + 0.5);
}

char clamped(qint64 value)
{
    return static_cast<char>(qBound<qint64>(0, value, 255));
}

/// Rounded as the common JPEG library does, so that the pixels are the ones that others get.
void convertToRgb(QByteArray& pixels)
{
    constexpr qint64 kHalf = 32768;
    char* at = pixels.data();
    for (char* end = at + pixels.size() / 3 * 3; at != end; at += 3) {
        const qint64 luma = quint8(at[0]);
        const qint64 blue = quint8(at[1]) - 128;
        const qint64 red = quint8(at[2]) - 128;
        at[0] = clamped(luma + ((fixed(1.402) * red + kHalf) >> 16));
        at[1] = clamped(luma + ((-fixed(0.34414) * blue - fixed(0.71414) * red + kHalf) >> 16));
        at[2] = clamped(luma + ((fixed(1.772) * blue + kHalf) >> 16));
    }
}

/// Eight pixels in a byte, the first in the lowest bit.
QByteArray packed(const QByteArray& pixels)
{
    QByteArray bits((pixels.size() + 7) / 8, 0);
    for (int i = 0; i < pixels.size(); ++i) {
        if (pixels.at(i) != 0)
            bits[i / 8] = static_cast<char>(quint8(bits.at(i / 8)) | (1U << unsigned(i % 8)));
    }
    return bits;
}

bool keepsColour(const QByteArray& syntax)
{
    return syntax == "1.2.840.10008.1.2.5" || syntax == "1.2.840.10008.1.2.8.1";
}

}  // namespace

bool FrameIndex::canDecode() const
{
    if (!d->isEncapsulated)
        return true;
    for (const char* uid : kDecoded) {
        if (d->transferSyntaxUID == uid)
            return d->layoutFault.good();
    }
    return false;
}

/// Decoders of JPEG and JPEG 2000 give RGB or what is made RGB below; the others leave colours as they are.
QByteArray FrameIndex::decodedPhotometric() const
{
    const bool isConverted =
        d->isEncapsulated && d->layout.samples == 3 && !keepsColour(d->transferSyntaxUID);
    return isConverted ? QByteArray("RGB") : d->layout.photometric;
}

Result FrameIndex::readDecoded(MediaSource& file, int frame, QByteArray& bytes) const
{
    QByteArray stored;
    Result result = readStored(file, frame, stored);
    if (result.bad() || !d->isEncapsulated) {
        bytes = stored;
        return result;
    }
    if (d->layoutFault.bad())
        return d->layoutFault;
    StoredFrame decoded;
    result = decodeFrame(stored, DcmXfer(d->transferSyntaxUID.constData()).getXfer(), d->layout, 0, decoded);
    if (result.bad())
        return result;
    QByteArray& pixels = decoded.pixels.pixels;
    if (pixels.size() != d->layout.frameBytes())
        return Result::failure(QStringLiteral("A decoded frame has %1 bytes").arg(pixels.size()));
    const bool isYbr = decoded.colour == StoredFrame::Colour::YbrFull && !keepsColour(d->transferSyntaxUID);
    if (isYbr && sizeOf(decoded.pixels.type) != 1)
        return Result::failure(QStringLiteral("YBR colours of more than 8 bits cannot be converted"));
    if (isYbr)
        convertToRgb(pixels);
    bytes = d->layout.bitsAllocated == 1 ? packed(pixels) : pixels;
    return {};
}

}  // namespace Kdd
