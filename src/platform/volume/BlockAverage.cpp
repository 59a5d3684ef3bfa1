#include "platform/volume/BlockAverage.h"

#include "platform/volume/PixelTypes.h"
#include "platform/volume/ValueRange.h"

#include <algorithm>
#include <cmath>
#include <type_traits>

namespace Kdd
{

namespace
{

template <typename To>
To toValue(double mean)
{
    // The mean of whole numbers lies among them, so what is rounded fits their type.
    if constexpr (std::is_integral_v<To>)
        return static_cast<To>(std::llround(mean));
    else
        return toFloat(mean);
}

/// Where the numbers of one component stand in a picture [numbers].
struct Block
{
    int side;
    qint64 pixelStep;
    qint64 rowStep;
};

template <typename T>
double meanOf(const T* corner, const Block& block, double blank)
{
    double sum = 0;
    int count = 0;
    for (int y = 0; y < block.side; ++y) {
        const T* row = corner + y * block.rowStep;
        for (int x = 0; x < block.side; ++x) {
            const auto value = double(row[x * block.pixelStep]);
            // One value that is no number would spoil the mean of its whole block.
            if (std::is_floating_point_v<T> && !std::isfinite(value))
                continue;
            sum += value;
            ++count;
        }
    }
    return count > 0 ? sum / count : blank;
}

template <typename From, typename To>
void average(const TypedData2D& pixels, int factor, double blank, TypedData2D& means)
{
    const int components = pixels.components;
    const Block block{factor, components, qint64(pixels.width) * components};
    To* to = valuesOf<To>(means);
    for (int y = 0; y < means.height; ++y) {
        const From* row = valuesOf<From>(pixels) + qint64(y) * factor * block.rowStep;
        for (int x = 0; x < means.width; ++x) {
            for (int i = 0; i < components; ++i)
                *to++ = toValue<To>(meanOf(row + qint64(x) * factor * components + i, block, blank));
        }
    }
}

/// Previews know neither 32-bit counts nor doubles.
template <typename T>
using Shown = std::conditional_t<std::is_same_v<T, quint32> || std::is_same_v<T, double>, float, T>;

}  // namespace

int reductionFactor(const TypedData2D& pixels, int width, int height)
{
    if (width < 1 || height < 1)
        return 1;
    // The smaller of the two, so that neither side falls below what is asked for.
    return qMax(1, qMin(pixels.width / width, pixels.height / height));
}

TypedData2D averageBlocks(const TypedData2D& pixels, int factor, double blank, Means means)
{
    return visitPixelType(pixels.type, [&](auto zero) {
        using From = decltype(zero);
        // Nothing to average and nothing to blank: whole numbers always have a value.
        if (factor == 1 && std::is_integral_v<From> && std::is_same_v<From, Shown<From>>)
            return pixels;
        const bool isFloat = means == Means::Exact || !std::is_same_v<From, Shown<From>>;
        TypedData2D reduced = pixels;
        reduced.type = isFloat ? PrimitiveType::Float32 : pixels.type;
        reduced.width /= factor;
        reduced.height /= factor;
        allocatePixels(reduced);
        if (isFloat)
            average<From, float>(pixels, factor, blank, reduced);
        else
            average<From, From>(pixels, factor, blank, reduced);
        return reduced;
    });
}

TypedData2D scaleValues(const TypedData2D& pixels, double slope, double intercept)
{
    // The values keep their type then, and the copy shares their bytes.
    if (slope == 1 && intercept == 0)
        return pixels;
    TypedData2D scaled = pixels;
    scaled.type = PrimitiveType::Float32;
    allocatePixels(scaled);
    visitPixelType(pixels.type, [&](auto zero) {
        const auto* values = valuesOf<decltype(zero)>(pixels);
        std::transform(values, values + numValues(pixels), valuesOf<float>(scaled),
                       [&](auto value) { return toFloat(slope * double(value) + intercept); });
    });
    return scaled;
}

}  // namespace Kdd
