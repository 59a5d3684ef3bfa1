#include "platform/volume/BlockAverage.h"
#include "platform/volume/ImageAttributes.h"
#include "platform/volume/LookupTable.h"
#include "platform/volume/PixelTypes.h"
#include "platform/volume/ShownPixels.h"
#include "platform/volume/StoredFrame.h"

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcitem.h>

#include <algorithm>
#include <cmath>

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

/// From 0, black, to 1, white.
double shownBy(const FrameWindow& window, double value)
{
    // Of one step: a threshold.
    constexpr double kLeastWidth = 1e-6;
    switch (window.function) {
    case FrameWindow::Function::Linear:
        return (value - (window.center - 0.5)) / qMax(window.width - 1, kLeastWidth) + 0.5;
    case FrameWindow::Function::LinearExact:
        return (value - window.center) / window.width + 0.5;
    case FrameWindow::Function::Sigmoid:
        break;
    }
    return 1 / (1 + std::exp(-4 * (value - window.center) / window.width));
}

/// The picture as the window has it; the functions say what black and white are to a half of a step.
ShownPixels spreadBy(const FrameWindow& window, const TypedData2D& pixels)
{
    ShownPixels shown{pixels, {0, 1}};
    shown.pixels.type = PrimitiveType::Float32;
    allocatePixels(shown.pixels);
    visitPixelType(pixels.type, [&](auto zero) {
        const auto* values = valuesOf<decltype(zero)>(pixels);
        std::transform(values, values + numValues(pixels), valuesOf<float>(shown.pixels),
                       [&](auto value) { return toFloat(shownBy(window, double(value))); });
    });
    return shown;
}

/// The pixels with another value in the place of padding; as they are when nothing but padding is there.
TypedData2D withoutPadding(const TypedData2D& pixels, const ValueRange& padding)
{
    const ValueRange all = rangeOf(pixels, padding);
    const double other = padding.contains(all.lowest) ? all.highest : all.lowest;
    if (padding.isEmpty() || padding.contains(other))
        return pixels;
    TypedData2D filled = pixels;
    visitPixelType(filled.type, [&](auto zero) {
        using Value = decltype(zero);
        auto* values = valuesOf<Value>(filled);
        std::replace_if(
            values, values + numValues(filled), [&](Value value) { return padding.contains(double(value)); },
            static_cast<Value>(other));
    });
    return filled;
}

/// Of the values that a table makes, but for those it makes of padding.
ValueRange rangeThrough(const LookupTable& table, const TypedData2D& pixels, const ValueRange& padding)
{
    const ValueRange range = rangeOf(table.appliedTo(withoutPadding(pixels, padding)));
    // One value alone shows nothing.
    return range.lowest < range.highest ? range : rangeOf(table.appliedTo(pixels));
}

}  // namespace

ShownPixels showGrey(DcmItem& dataset, const FrameView& view, const StoredFrame& stored)
{
    const ImageAttributes attributes(dataset, view.frame);
    const PrimitiveType type = stored.pixels.type;
    Rescale rescale = rescaleOf(attributes);
    const ValueRange padding = paddingOf(attributes, type);
    ShownPixels shown{stored.pixels, rangeOf(stored.pixels, padding)};
    const LookupTable modality = modalityTableOf(attributes, isSigned(type));
    if (!modality.isEmpty()) {
        shown.pixels = modality.appliedTo(stored.pixels);
        shown.range = rangeThrough(modality, stored.pixels, padding);
        // The table takes the place of the rescale.
        rescale = Rescale();
    }

    shown.range = shown.range.scaled(rescale.slope, rescale.intercept);
    const ValueRange window = windowOf(attributes);
    const bool hasWindow = view.window || window.overlaps(shown.range);
    // It is looked up in after the rescale, so it is signed when those values reach below zero.
    const LookupTable voi =
        tableOf(attributes, DCM_FrameVOILUTSequence, DCM_VOILUTSequence, shown.range.lowest < 0);
    if (!hasWindow && !voi.isEmpty())
        return reduce({voi.appliedTo(shown.pixels, rescale.slope, rescale.intercept), voi.range()},
                      view.width, view.height);
    // A window that shows none of the values was made for others, so it would show a black or a white image.
    if (hasWindow && !view.window)
        shown.range = window;
    // Averaging and rescaling may change places, as both are linear; this way only the small picture is rescaled.
    const ValueRange storedRange = shown.range.scaled(1 / rescale.slope, -rescale.intercept / rescale.slope);
    const ShownPixels reduced = reduce({shown.pixels, storedRange}, view.width, view.height);
    const TypedData2D values = scaleValues(reduced.pixels, rescale.slope, rescale.intercept);
    return view.window ? spreadBy(*view.window, values) : ShownPixels{values, shown.range};
}

}  // namespace Kdd
