#include "platform/volume/ValueRange.h"

#include "platform/volume/PixelTypes.h"

#include <algorithm>
#include <cmath>
#include <limits>

namespace Kdd
{

namespace
{

template <typename T>
ValueRange rangeWithout(const TypedData2D& pixels, const ValueRange& padding)
{
    // The wrong way round, so that without any value the range is empty.
    T lowest = std::numeric_limits<T>::max();
    T highest = std::numeric_limits<T>::lowest();
    const T* value = valuesOf<T>(pixels);
    for (const T* end = value + numValues(pixels); value != end; ++value) {
        if (padding.contains(double(*value)) || !std::isfinite(double(*value)))
            continue;
        lowest = std::min(lowest, *value);
        highest = std::max(highest, *value);
    }
    return lowest <= highest ? ValueRange{double(lowest), double(highest)} : ValueRange{};
}

}  // namespace

ValueRange ValueRange::scaled(double slope, double intercept) const
{
    if (isEmpty())
        return *this;
    // A negative slope changes places.
    const auto [least, most] = std::minmax({slope * lowest + intercept, slope * highest + intercept});
    return {least, most};
}

float toFloat(double value)
{
    // The conversion of anything more is undefined.
    constexpr double kMost = std::numeric_limits<float>::max();
    return static_cast<float>(qBound(-kMost, value, kMost));
}

ValueRange rangeOf(const TypedData2D& pixels, const ValueRange& padding)
{
    return visitPixelType(pixels.type, [&](auto zero) {
        using T = decltype(zero);
        const ValueRange range = rangeWithout<T>(pixels, padding);
        // A mask of which one value is declared as padding shows nothing without it.
        const bool isFlat = !(range.lowest < range.highest);
        return isFlat && !padding.isEmpty() ? rangeWithout<T>(pixels, {}) : range;
    });
}

}  // namespace Kdd
