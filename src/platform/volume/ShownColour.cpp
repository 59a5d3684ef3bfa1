#include "platform/volume/LookupTable.h"
#include "platform/volume/PixelTypes.h"
#include "platform/volume/ShownPixels.h"
#include "platform/volume/StoredFrame.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcitem.h>

#include <algorithm>
#include <array>
#include <cmath>

namespace Kdd
{

namespace
{

using Palette = std::array<LookupTable, 3>;

Result readPalette(DcmItem& dataset, Palette& palette)
{
    struct Channel
    {
        DcmTagKey descriptor;
        DcmTagKey data;
    };
    const Channel channels[] = {
        {DCM_RedPaletteColorLookupTableDescriptor, DCM_RedPaletteColorLookupTableData},
        {DCM_GreenPaletteColorLookupTableDescriptor, DCM_GreenPaletteColorLookupTableData},
        {DCM_BluePaletteColorLookupTableDescriptor, DCM_BluePaletteColorLookupTableData}};
    Uint16 representation = 0;
    // The first number of a table is signed when the pixels are.
    dataset.findAndGetUint16(DCM_PixelRepresentation, representation);
    for (size_t i = 0; i < palette.size(); ++i) {
        Result result = readLookupTable(dataset, channels[i].descriptor, channels[i].data,
                                        representation == 1, palette[i]);
        if (result.bad())
            return result.within(QStringLiteral("Palette"));
    }
    return Result();
}

/// Writers fill entries declared with sixteen bits with eight, and the other way round: the values tell.
double mostOf(const Palette& palette)
{
    double most = 0;
    for (const LookupTable& table : palette)
        most = std::max(most, table.range().highest);
    return most > 255 ? 65535 : 255;
}

TypedData2D applyPalette(const TypedData2D& numbers, const Palette& palette)
{
    // Eight bits are shown, of sixteen the upper ones.
    const int shift = mostOf(palette) > 255 ? 8 : 0;
    TypedData2D colours{numbers.width, numbers.height, 3, PrimitiveType::UInt8, {}};
    allocatePixels(colours);
    visitPixelType(numbers.type, [&](auto zero) {
        const auto* number = valuesOf<decltype(zero)>(numbers);
        auto* to = valuesOf<quint8>(colours);
        for (qint64 i = 0; i < numValues(numbers); ++i) {
            for (const LookupTable& table : palette)
                *to++ = static_cast<quint8>(table.at(static_cast<qint64>(number[i])) >> shift);
        }
    });
    return colours;
}

template <typename T>
T withinRange(double value, double most)
{
    return static_cast<T>(std::lround(qBound(0.0, value, most)));
}

/// Luminance and chroma over the full range, chroma centred at half of it.
void convertYbrToRgb(TypedData2D& pixels, double most)
{
    const double centre = (most + 1) / 2;
    visitPixelType(pixels.type, [&](auto zero) {
        using T = decltype(zero);
        T* pixel = valuesOf<T>(pixels);
        for (const T* end = pixel + numValues(pixels); pixel != end; pixel += 3) {
            const auto y = double(pixel[0]);
            const double cb = double(pixel[1]) - centre;
            const double cr = double(pixel[2]) - centre;
            pixel[0] = withinRange<T>(y + 1.402 * cr, most);
            pixel[1] = withinRange<T>(y - 0.344136 * cb - 0.714136 * cr, most);
            pixel[2] = withinRange<T>(y + 1.772 * cb, most);
        }
    });
}

/// The brightest that a channel can be.
double brightest(DcmItem& dataset, const TypedData2D& pixels)
{
    const int allocated = 8 * sizeOf(pixels.type);
    Uint16 stored = 0;
    const bool isTold =
        dataset.findAndGetUint16(DCM_BitsStored, stored).good() && stored >= 1 && stored <= allocated;
    return std::exp2(isTold ? stored : allocated) - 1;
}

}  // namespace

Result showColour(DcmItem& dataset, const StoredFrame& stored, int width, int height, ShownPixels& shown)
{
    if (stored.colour == StoredFrame::Colour::Palette) {
        Palette palette;
        Result read = readPalette(dataset, palette);
        if (read.bad())
            return read;
        // The palette first, because numbers of colours cannot be averaged.
        shown = reduce({applyPalette(stored.pixels, palette), {0, 255}}, width, height);
        return Result();
    }
    const double most = brightest(dataset, stored.pixels);
    // Reduced first, so that only the small picture is converted.
    shown = reduce({stored.pixels, {0, most}}, width, height);
    if (stored.colour == StoredFrame::Colour::YbrFull)
        convertYbrToRgb(shown.pixels, most);
    return Result();
}

}  // namespace Kdd
