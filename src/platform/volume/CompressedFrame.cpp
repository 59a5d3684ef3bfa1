#include "platform/volume/CompressedFrame.h"

#include "platform/decoder/DecoderPlace.h"
#include "platform/decoder/DecoderPool.h"
#include "platform/volume/ApartFrame.h"
#include "platform/volume/FragmentReader.h"
#include "platform/volume/FrameLayout.h"
#include "platform/volume/NativeFrame.h"

#include <libdeflate.h>

#include <memory>

namespace Kdd
{

namespace
{

Result noDecoder(const char* syntax)
{
    return Result::failure(QStringLiteral("There is no decoder for ") + QLatin1String(syntax));
}

}  // namespace

bool isVideo(E_TransferSyntax xfer)
{
    // These syntaxes stand in a row in DCMTK's numbering.
    return xfer >= EXS_MPEG2MainProfileAtMainLevel && xfer <= EXS_HEVCMain10ProfileLevel5_1;
}

Result checkCodestream(const FrameLayout& layout, qint64 columns, qint64 rows, qint64 samples, int precision)
{
    const bool isSame = columns == layout.columns && rows == layout.rows && samples == layout.samples;
    // Single bits may come in a codestream of eight.
    if (isSame && precision >= 1 && precision <= qMax(8, layout.bitsAllocated))
        return Result();
    return Result::failure(
        QStringLiteral("A codestream of %1 x %2 x %3 values of %4 bits does not fit an image of "
                       "%5 x %6 x %7 values of %8 bits")
            .arg(columns)
            .arg(rows)
            .arg(samples)
            .arg(precision)
            .arg(layout.columns)
            .arg(layout.rows)
            .arg(layout.samples)
            .arg(layout.bitsAllocated));
}

Result decodeDeflated(const QByteArray& bytes, const FrameLayout& layout, StoredFrame& out)
{
    constexpr qint64 kMostExpansion = 1032;  // of deflate, whatever it is given
    const qint64 size = (nativeFrameBits(layout, false) + 7) / 8;
    if (size > (qint64(bytes.size()) + 1) * kMostExpansion)
        return Result::failure(QStringLiteral("%1 deflated bytes cannot hold a frame").arg(bytes.size()));
    const std::unique_ptr<libdeflate_decompressor, decltype(&libdeflate_free_decompressor)> inflater(
        libdeflate_alloc_decompressor(), &libdeflate_free_decompressor);
    if (inflater == nullptr)
        return Result::failure(QStringLiteral("There is no memory to decompress the frame"));
    // A frame of an odd number of bytes is padded before it is compressed.
    QByteArray frame(static_cast<int>(size + size % 2), Qt::Uninitialized);
    size_t done = 0;
    const auto status =
        libdeflate_deflate_decompress(inflater.get(), bytes.constData(), static_cast<size_t>(bytes.size()),
                                      frame.data(), static_cast<size_t>(frame.size()), &done);
    // The byte of padding may be missing, a byte of the frame may not.
    if (status != LIBDEFLATE_SUCCESS || qint64(done) < size)
        return Result::failure(
            QStringLiteral("The compressed pixel data are of no kind that can be decoded"));
    out.pixels = unpackFrame(frame, layout, 0, false);
    return Result();
}

Result decodeCodestream(const QByteArray& bytes, const FrameLayout& layout, int least, StoredFrame& out)
{
    return recognizeCodestream(bytes) == Codestream::Jpeg2000 ? decodeJpeg2000(bytes, layout, least, out)
                                                              : decodeJpeg(bytes, layout, out);
}

Result decodeFrame(const QByteArray& bytes, E_TransferSyntax xfer, const FrameLayout& layout, int least,
                   StoredFrame& out)
{
    switch (recognizeCodestream(bytes)) {
    case Codestream::Jpeg:
    case Codestream::Jpeg2000:
        return decoderPlace() == DecoderPlace::Inside
                   ? decodeCodestream(bytes, layout, least, out)
                   : decodeFrameApart(DecoderPool::ofProcess(), bytes, layout, least, out);
    case Codestream::JpegXl:
        return noDecoder("JPEG XL");
    case Codestream::Unknown:
        break;
    }
    if (xfer == EXS_RLELossless)
        return decodeRle(bytes, layout, out);
    const DcmXfer syntax(xfer);
    if (syntax.isEncapsulated())
        return Result::failure(QStringLiteral("The pixel data are not what their transfer syntax says: ") +
                               QLatin1String(syntax.getXferName()));
    // Deflated frames bear no mark of their own and DCMTK does not know their syntax, so they are what is
    // left to try.
    return decodeDeflated(bytes, layout, out);
}

}  // namespace Kdd
