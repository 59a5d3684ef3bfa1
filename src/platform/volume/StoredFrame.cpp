#include "platform/volume/StoredFrame.h"

#include "platform/volume/CompressedFrame.h"
#include "platform/volume/FragmentReader.h"
#include "platform/volume/FrameLayout.h"
#include "platform/volume/NativeFrame.h"

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcitem.h>

namespace Kdd
{

namespace
{

DcmElement* findPixels(DcmItem& dataset)
{
    // An image has one of the three.
    for (const DcmTagKey& key : {DCM_PixelData, DCM_FloatPixelData, DCM_DoubleFloatPixelData}) {
        DcmElement* element = nullptr;
        if (dataset.findAndGetElement(key, element).good())
            return element;
    }
    return nullptr;
}

/// What the pixels mean where the codestream has not told.
StoredFrame::Colour colourOf(const FrameLayout& layout)
{
    if (layout.samples == 1)
        return layout.photometric == "PALETTE COLOR" ? StoredFrame::Colour::Palette
                                                     : StoredFrame::Colour::Grey;
    return layout.photometric.startsWith("YBR") ? StoredFrame::Colour::YbrFull : StoredFrame::Colour::Rgb;
}

Result readCompressedFrame(DcmPixelSequence& fragments, E_TransferSyntax xfer, const FrameLayout& layout,
                           int frame, int least, StoredFrame& out)
{
    // A frame of a video depends on those before it, so it is found by playing and not by number.
    if (isVideo(xfer))
        return Result::failure(QStringLiteral("A video has no stored frames: ") +
                               QLatin1String(DcmXfer(xfer).getXferName()));
    QByteArray bytes;
    Result read = readFrameBytes(fragments, frame, layout.frames, bytes);
    return read.bad() ? read : decodeFrame(bytes, xfer, layout, least, out);
}

}  // namespace

Result readStoredFrame(DcmItem& dataset, int frame, int least, StoredFrame& out)
{
    DcmElement* pixels = findPixels(dataset);
    if (!pixels)
        return Result::failure(QStringLiteral("There are no pixel data"));
    FrameLayout layout;
    Result described = readFrameLayout(dataset, layout);
    if (described.bad())
        return described;
    if (frame < 0 || frame >= layout.frames)
        return Result::failure(
            QStringLiteral("There is no frame %1 among %2").arg(qint64(frame) + 1).arg(layout.frames));

    // Filled aside: on failure the caller's frame stays as it was.
    StoredFrame read;
    read.colour = colourOf(layout);
    // Numbers of colours cannot be averaged, so a codec must not do it either.
    const int reducible = read.colour == StoredFrame::Colour::Palette ? 0 : least;
    E_TransferSyntax xfer = EXS_Unknown;
    DcmPixelSequence* fragments = findFragments(*pixels, xfer);
    Result result = fragments ? readCompressedFrame(*fragments, xfer, layout, frame, reducible, read)
                              : readNativeFrame(*pixels, layout, frame, read);
    if (result.good())
        out = read;
    return result;
}

}  // namespace Kdd
