#include "kddlib/items/FrameIndexData.h"
#include "platform/volume/FrameEncoding.h"
#include "platform/volume/NativeFrame.h"

namespace Kdd
{

namespace
{

struct Encoding
{
    const char* uid;
    FrameCoding coding;
};

/// By the time that they take.
constexpr Encoding kEncodings[] = {
    {"1.2.840.10008.1.2.5", FrameCoding::Rle},
    {"1.2.840.10008.1.2.4.70", FrameCoding::JpegLossless},
    {"1.2.840.10008.1.2.4.80", FrameCoding::JpegLs},
};

/// How a frame is laid out when all of it is decoded. All allocated bits count as stored ones: overlays may lie beside
/// the value.
FrameLayout wholeLayout(const FrameIndex::Private& found, const QByteArray& photometric)
{
    FrameLayout layout = found.layout;
    layout.isPlanar = false;
    layout.photometric = photometric;
    layout.bitsStored = layout.bitsAllocated;
    layout.highBit = layout.bitsAllocated - 1;
    return layout;
}

}  // namespace

QByteArray FrameIndex::encodedPhotometric() const
{
    const QByteArray photometric = decodedPhotometric();
    return photometric == "YBR_FULL_422" ? QByteArray("YBR_FULL") : photometric;
}

QVector<QByteArray> FrameIndex::encodings() const
{
    QVector<QByteArray> uids;
    if (!hasPixels() || !canDecode() || d->layoutFault.bad())
        return uids;
    const FrameLayout layout = wholeLayout(*d, decodedPhotometric());
    for (const Encoding& each : kEncodings) {
        if (d->transferSyntaxUID != each.uid && canEncode(each.coding, layout))
            uids.append(each.uid);
    }
    return uids;
}

Result FrameIndex::readEncoded(MediaSource& file, int frame, const QByteArray& syntaxUID,
                               QByteArray& bytes) const
{
    QByteArray pixels;
    Result result = readDecoded(file, frame, pixels);
    if (result.bad())
        return result;
    FrameLayout layout = wholeLayout(*d, encodedPhotometric());
    if (!d->isEncapsulated && (d->layout.isPlanar || d->sharesChroma)) {
        layout.isPlanar = d->layout.isPlanar;
        pixels = unpackFrame(pixels, layout, 0, d->sharesChroma).pixels;
        layout.isPlanar = false;
    }
    for (const Encoding& each : kEncodings) {
        if (syntaxUID == each.uid)
            return encodeFrame(each.coding, pixels, layout, bytes);
    }
    return Result::failure(QStringLiteral("Frames are not written in the transfer syntax ") +
                           QString::fromLatin1(syntaxUID));
}

}  // namespace Kdd
