#include "platform/volume/KxVolumeInfo.h"

#include "platform/volume/CompressedFrame.h"
#include "platform/volume/FragmentReader.h"
#include "platform/volume/ImageAttributes.h"
#include "platform/volume/KxCompressedDataMedia.h"
#include "platform/volume/ShownPixels.h"
#include "platform/volume/StoredFrame.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdatset.h>
#include <dcmtk/dcmdata/dcdeftag.h>

namespace Kdd
{

namespace
{

using Info = std::shared_ptr<KxVolumeInfo>;

Info infoOf(const ShownPixels& shown, double aspect, bool isInverted)
{
    const ShownPixels spread = spreadNarrowRange(shown);
    return std::make_shared<KxVolumeInfo>(
        spread.pixels, static_cast<KxVolumeInfo::ComponentCode>(spread.pixels.components),
        toFloat(spread.range.lowest), toFloat(spread.range.highest), toFloat(aspect), isInverted);
}

/// Frames of the middle third, the middle one first: of segmentations it may well be empty.
QVector<int> candidates(int frames)
{
    QVector<int> numbers;
    // Six twelfths are the middle, four and eight the ends of the middle third.
    for (const int twelfth : {6, 5, 7, 4, 8}) {
        const auto number = static_cast<int>(qint64(frames) * twelfth / 12);
        if (number < frames && !numbers.contains(number))
            numbers.append(number);
    }
    return numbers;
}

bool isBlank(const TypedData2D& pixels)
{
    // One value throughout shows nothing, whatever it is.
    const ValueRange range = rangeOf(pixels);
    return !(range.lowest < range.highest);
}

/// The first candidate that shows something, else the first that can be decoded, else why the first cannot.
Result readRepresentative(DcmDataset& dataset, int least, int& number, StoredFrame& frame)
{
    Result result;
    bool isFound = false;
    for (const int candidate : candidates(numberOfFrames(dataset))) {
        StoredFrame read;
        const Result reading = readStoredFrame(dataset, candidate, least, read);
        // The first reason is told: the frames after it mostly fail for the same one.
        if (reading.bad() && result.good())
            result = reading;
        const bool showsMore = reading.good() && (!isFound || !isBlank(read.pixels));
        if (showsMore) {
            number = candidate;
            frame = read;
            isFound = true;
        }
        // No more is decoded than it takes.
        if (isFound && !isBlank(frame.pixels))
            break;
    }
    return isFound ? Result() : result;
}

/// Either says so; with both it is said twice and not undone.
bool isInverted(DcmDataset& dataset)
{
    return textOf(dataset, DCM_PhotometricInterpretation) == "MONOCHROME1" ||
           textOf(dataset, DCM_PresentationLUTShape) == "INVERSE";
}

Info showFrame(DcmDataset& dataset, const FrameView& asked, Result& result)
{
    FrameView view = asked;
    StoredFrame frame;
    // By the larger of the two, since a codec halves both sides at once and neither may fall below.
    const int least = qMax(view.width, view.height);
    result = view.frame == FrameView::kRepresentative ? readRepresentative(dataset, least, view.frame, frame)
                                                      : readStoredFrame(dataset, view.frame, least, frame);
    if (result.bad())
        return nullptr;
    const double aspect = pixelAspect(ImageAttributes(dataset, view.frame));
    if (frame.colour == StoredFrame::Colour::Grey)
        return infoOf(showGrey(dataset, view, frame), aspect, isInverted(dataset));
    ShownPixels shown;
    result = showColour(dataset, frame, view.width, view.height, shown);
    return result.good() ? infoOf(shown, aspect, false) : nullptr;
}

Info showVideo(DcmPixelSequence& fragments, int width, int height, Result& result)
{
    FragmentSource source(fragments);
    TypedData2D frame;
    result = KxCompressedDataMedia::decodeRepresentativeFrame(source, width, height,
                                                              KxCompressedDataMedia::kRepresentative, frame);
    return result.good() ? KxVolumeInfo::fromFrame(nullptr, frame) : nullptr;
}

DcmPixelSequence* findVideo(DcmDataset& dataset)
{
    DcmElement* pixels = nullptr;
    E_TransferSyntax xfer = EXS_Unknown;
    DcmPixelSequence* fragments =
        dataset.findAndGetElement(DCM_PixelData, pixels).good() ? findFragments(*pixels, xfer) : nullptr;
    // Its fragments are one stream, of which no frame can be read alone.
    return isVideo(xfer) ? fragments : nullptr;
}

}  // namespace

Info KxVolumeInfo::readVolumeInfo(DcmDataset* dataset, int width, int height, const QString& path,
                                  Result& result)
{
    if (!dataset) {
        result = Result::failure(QStringLiteral("There is no dataset")).within(path);
        return nullptr;
    }
    FrameView view;
    view.width = width;
    view.height = height;
    return readVolumeInfo(*dataset, view, path, result);
}

Info KxVolumeInfo::readVolumeInfo(DcmDataset& dataset, const FrameView& view, const QString& path,
                                  Result& result)
{
    DcmPixelSequence* video = findVideo(dataset);
    Info info;
    if (video == nullptr)
        info = showFrame(dataset, view, result);
    else if (view.frame == FrameView::kRepresentative)
        info = showVideo(*video, view.width, view.height, result);
    else
        result = Result::failure(QStringLiteral("A frame of a video does not stand alone"));
    result = result.within(path);
    return info;
}

}  // namespace Kdd
