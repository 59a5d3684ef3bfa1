#include "platform/volume/ShownPixels.h"

#include "platform/volume/BlockAverage.h"

namespace Kdd
{

namespace
{

/// Of so few steps that half of one is seen: more than two of 255 grey levels.
bool isNarrow(const ValueRange& range)
{
    return range.highest - range.lowest < 64;
}

}  // namespace

ShownPixels reduce(const ShownPixels& shown, int width, int height)
{
    const int factor = reductionFactor(shown.pixels, width, height);
    // Of a mask of zeros and ones, rounded means would lose everything that is smaller than half a block.
    const Means means = isNarrow(shown.range) ? Means::Exact : Means::Rounded;
    return {averageBlocks(shown.pixels, factor, shown.range.lowest, means), shown.range};
}

ShownPixels spreadNarrowRange(const ShownPixels& shown)
{
    constexpr double kWide = 65535;
    // There is no finite value at all, so any range will do.
    if (shown.range.isEmpty())
        return {shown.pixels, {0, 0}};
    const double width = shown.range.highest - shown.range.lowest;
    if (!(width > 0) || !isNarrow(shown.range))
        return shown;
    const double slope = kWide / width;
    return {scaleValues(shown.pixels, slope, -shown.range.lowest * slope), {0, kWide}};
}

}  // namespace Kdd
