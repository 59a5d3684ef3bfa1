#include "platform/volume/BlockAverage.h"
#include "platform/volume/ImageAttributes.h"
#include "platform/volume/LookupTable.h"
#include "platform/volume/ShownPixels.h"
#include "platform/volume/StoredFrame.h"

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcitem.h>

#include <algorithm>

namespace Kdd
{

namespace
{

/// From stored values to those that the windows speak of.
struct Rescale
{
    double slope = 1;
    double intercept = 0;
};

Rescale rescaleOf(const ImageAttributes& attributes)
{
    const auto slope = attributes.numbers(DCM_PixelValueTransformationSequence, DCM_RescaleSlope);
    const auto intercept = attributes.numbers(DCM_PixelValueTransformationSequence, DCM_RescaleIntercept);
    // A slope of zero would make the whole image one grey.
    return {slope.isEmpty() || slope.first() == 0 ? 1 : slope.first(), intercept.value(0, 0)};
}

bool isSigned(PrimitiveType type)
{
    return type == PrimitiveType::Int8 || type == PrimitiveType::Int16 || type == PrimitiveType::Int32;
}

/// The first item of a sequence of tables; an empty table when there is none that can be used.
LookupTable tableOf(const ImageAttributes& attributes, const DcmTagKey& group, const DcmTagKey& sequence,
                    bool hasSign)
{
    LookupTable table;
    DcmItem* holder = attributes.find(group, sequence);
    DcmItem* item = nullptr;
    if (holder && holder->findAndGetSequenceItem(sequence, item, 0).good() && item &&
        readLookupTable(*item, DCM_LUTDescriptor, DCM_LUTData, hasSign, table).bad())
        return {};
    return table;
}

/// X-ray angiograms and fluoroscopies may bring a table that leads from logarithmic values back to intensities, for
/// measurements. What is shown is the logarithm, and of the intensities nearly all would be white.
bool isForMeasuring(const ImageAttributes& attributes)
{
    DcmItem& dataset = attributes.dataset();
    const QByteArray modality = textOf(dataset, DCM_Modality);
    return (modality == "XA" || modality == "RF") && textOf(dataset, DCM_PixelIntensityRelationship) == "LOG";
}

/// The table that makes of stored values those that the windows speak of; empty when there is none.
LookupTable modalityTableOf(const ImageAttributes& attributes, bool hasSign)
{
    return isForMeasuring(attributes)
               ? LookupTable()
               : tableOf(attributes, DCM_UndefinedTagKey, DCM_ModalityLUTSequence, hasSign);
}

/// Padding of whole numbers is written as US or SS, whatever the pixels are; the same bits count.
double asPixel(double padding, PrimitiveType type)
{
    if (type == PrimitiveType::Float32 || type == PrimitiveType::Float64)
        return padding;
    const auto bits = static_cast<quint16>(static_cast<qint64>(qBound(-32768.0, padding, 65535.0)));
    return isSigned(type) ? double(static_cast<qint16>(bits)) : double(bits);
}

/// The limit may lie on either side of the value.
ValueRange paddingOf(const ImageAttributes& attributes, const DcmTagKey& value, const DcmTagKey& limit,
                     PrimitiveType type)
{
    const auto first = attributes.numbers(DCM_UndefinedTagKey, value);
    if (first.isEmpty())
        return {};
    const auto last = attributes.numbers(DCM_UndefinedTagKey, limit);
    const auto [least, most] =
        std::minmax({asPixel(first.first(), type), asPixel(last.value(0, first.first()), type)});
    return {least, most};
}

ValueRange paddingOf(const ImageAttributes& attributes, PrimitiveType type)
{
    if (type == PrimitiveType::Float32)
        return paddingOf(attributes, DCM_FloatPixelPaddingValue, DCM_FloatPixelPaddingRangeLimit, type);
    if (type == PrimitiveType::Float64)
        return paddingOf(attributes, DCM_DoubleFloatPixelPaddingValue, DCM_DoubleFloatPixelPaddingRangeLimit,
                         type);
    return paddingOf(attributes, DCM_PixelPaddingValue, DCM_PixelPaddingRangeLimit, type);
}

}  // namespace

ShownPixels showGrey(DcmItem& dataset, int frame, const StoredFrame& stored, int width, int height)
{
    const ImageAttributes attributes(dataset, frame);
    const PrimitiveType type = stored.pixels.type;
    Rescale rescale = rescaleOf(attributes);
    ShownPixels shown{stored.pixels, rangeOf(stored.pixels, paddingOf(attributes, type))};
    const LookupTable modality = modalityTableOf(attributes, isSigned(type));
    if (!modality.isEmpty()) {
        shown.pixels = modality.appliedTo(stored.pixels);
        shown.range = rangeOf(shown.pixels);
        // The table takes the place of the rescale.
        rescale = Rescale();
    }

    shown.range = shown.range.scaled(rescale.slope, rescale.intercept);
    const ValueRange window = windowOf(attributes);
    const bool hasWindow = window.overlaps(shown.range);
    // It is looked up in after the rescale, so it is signed when those values reach below zero.
    const LookupTable voi =
        tableOf(attributes, DCM_FrameVOILUTSequence, DCM_VOILUTSequence, shown.range.lowest < 0);
    if (!hasWindow && !voi.isEmpty())
        return reduce({voi.appliedTo(shown.pixels, rescale.slope, rescale.intercept), voi.range()}, width,
                      height);
    // A window that shows none of the values was made for others, so it would show a black or a white image.
    if (hasWindow)
        shown.range = window;
    // Averaging and rescaling may change places, as both are linear; this way only the small picture is rescaled.
    const ValueRange storedRange = shown.range.scaled(1 / rescale.slope, -rescale.intercept / rescale.slope);
    const ShownPixels reduced = reduce({shown.pixels, storedRange}, width, height);
    return {scaleValues(reduced.pixels, rescale.slope, rescale.intercept), shown.range};
}

}  // namespace Kdd
