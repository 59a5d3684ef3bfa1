#include "kddlib/volumes/StackValues.h"

#include "kddlib/volumes/RescaleSlopeCalculator.h"
#include "platform/volume/PixelTypes.h"

#include <algorithm>
#include <cmath>
#include <limits>

namespace Kdd
{

namespace
{

constexpr int kMaxBins = 4096;

/// The bits may differ: a stored value then means the same in all slices.
bool haveOneRescale(const QVector<StackFrame>& slices)
{
    const StackFrame& first = slices.first();
    return std::all_of(slices.begin(), slices.end(), [&](const StackFrame& slice) {
        return slice.slope == first.slope && slice.intercept == first.intercept &&
               slice.isSigned == first.isSigned;
    });
}

bool haveOnePadding(const QVector<StackFrame>& slices)
{
    const StackFrame& first = slices.first();
    return std::all_of(slices.begin(), slices.end(), [&](const StackFrame& slice) {
        return slice.hasPadding && slice.hasPaddingRange == first.hasPaddingRange &&
               slice.paddingMin == first.paddingMin && slice.paddingMax == first.paddingMax;
    });
}

/// Tells the calculator which physical values the slice can reach. It takes slopes for positive and lets images of
/// slope 1 and intercept 0 not widen the range, which would cut off their values. So the slice is put as the
/// unsigned image of positive slope that reaches the same values, and an intercept of 0 as the least number above.
void addReach(RescaleSlopeCalculator& calculator, const StackFrame& slice)
{
    const double half = slice.isSigned ? std::ldexp(1, slice.bitsStored - 1) : 0;
    const double least = -half;
    const double most = std::ldexp(1, slice.bitsStored) - 1 - half;
    const double lowest = qMin(least * slice.slope, most * slice.slope) + slice.intercept;
    const auto slope = static_cast<float>(std::fabs(slice.slope));
    auto intercept = static_cast<float>(lowest);
    if (slope == 1 && intercept == 0)
        intercept = std::numeric_limits<float>::min();
    calculator.add(slope, intercept, slice.bitsStored, false);
}

bool isSigned(PrimitiveType type)
{
    return type == PrimitiveType::Int8 || type == PrimitiveType::Int16;
}

}  // namespace

bool ValueCounts::isEmpty() const
{
    return minimum() > maximum();
}

int ValueCounts::minimum() const
{
    const auto first = std::find_if(mCounts.begin(), mCounts.end(), [](quint64 count) { return count != 0; });
    return first == mCounts.end() ? kHighest : static_cast<int>(first - mCounts.begin()) + kLowest;
}

int ValueCounts::maximum() const
{
    const auto last =
        std::find_if(mCounts.rbegin(), mCounts.rend(), [](quint64 count) { return count != 0; });
    return last == mCounts.rend() ? kLowest : kHighest - static_cast<int>(last - mCounts.rbegin());
}

KxHistogram ValueCounts::histogram() const
{
    if (isEmpty())
        return {};
    const int from = minimum();
    const int range = maximum() - from;
    const int count = qMin(range + 1, kMaxBins);
    QVector<quint64> bins(count);
    for (int i = 0; i <= range; ++i) {
        // The greatest value would begin a bin of its own behind the last one.
        const qint64 bin = range == 0 ? 0 : qMin<qint64>(qint64(i) * count / range, count - 1);
        bins[static_cast<int>(bin)] += mCounts.at(from + i - kLowest);
    }
    return {bins, double(from), double(from + range)};
}

StackValues::StackValues(const QVector<StackFrame>& slices)
{
    if (haveOneRescale(slices))
        keepStored(slices);
    else
        mapOntoCommon(slices);
}

/// The lattice has as many whole bytes as the slice of the most bits
/// needs, and room for every value of that width.
void StackValues::keepStored(const QVector<StackFrame>& slices)
{
    const StackFrame& first = slices.first();
    int bits = 0;
    for (const StackFrame& slice : slices)
        bits = qMax(bits, slice.bitsStored);
    const int width = bits > 8 ? 16 : 8;
    if (first.isSigned)
        mType = bits > 8 ? PrimitiveType::Int16 : PrimitiveType::Int8;
    else
        mType = bits > 8 ? PrimitiveType::UInt16 : PrimitiveType::UInt8;
    mLowest = first.isSigned ? -(1 << (width - 1)) : 0;
    mHighest = mLowest + (1 << width) - 1;
    mScale = first.slope;
    mBias = first.intercept;
    // Slices that disagree about padding keep all their values: what is padding in one may be measured in another.
    mHasPadding = haveOnePadding(slices);
    mHasPaddingRange = first.hasPaddingRange;
    mPaddingMin = first.paddingMin;
    mPaddingMax = first.paddingMax;
}

void StackValues::mapOntoCommon(const QVector<StackFrame>& slices)
{
    RescaleSlopeCalculator calculator;
    for (const StackFrame& slice : slices) {
        addReach(calculator, slice);
        mHasPadding = mHasPadding || slice.hasPadding;
    }
    mIsMapped = true;
    mScale = double(calculator.rescaleSlope());
    mBias = double(calculator.rescaleIntercept());
    mBitLoss = double(calculator.precisionBitLoss());
}

/// Outside the lattice when the stored value is more than the slice's bits can hold.
int StackValues::mapped(const StackFrame& slice, int stored) const
{
    if (slice.hasPadding && stored >= slice.paddingMin && stored <= slice.paddingMax)
        return 0;
    const double exact = (stored * slice.slope + slice.intercept - mBias) / mScale;
    // Less than one beyond the ends is rounding, which is brought back
    // below; what is no number is outside as well.
    if (!(exact > -1 && exact < mHighest + 1))
        return mLowest - 1;
    return qBound(mHasPadding ? 1 : 0, static_cast<int>(std::lround(exact)), mHighest);
}

template <typename T>
bool StackValues::convertAll(const StackFrame& slice, const T* stored, TypedData2D& lattice,
                             ValueCounts& counts) const
{
    const qint64 count = numValues(lattice);
    const bool isWide = sizeOf(mType) == 2;
    for (qint64 i = 0; i < count; ++i) {
        const int value = mIsMapped ? mapped(slice, stored[i]) : stored[i];
        if (value < mLowest || value > mHighest)
            return false;
        if (!isPadding(value))
            counts.add(value);
        // The bits of a signed number are those of the unsigned one of the same width.
        if (isWide)
            valuesOf<quint16>(lattice)[i] = static_cast<quint16>(value);
        else
            valuesOf<quint8>(lattice)[i] = static_cast<quint8>(value);
    }
    return true;
}

Result StackValues::convert(const StackFrame& slice, const TypedData2D& stored, TypedData2D& lattice,
                            ValueCounts& counts) const
{
    if (stored.components != 1 || sizeOf(stored.type) > 2 || isSigned(stored.type) != slice.isSigned)
        return Result::failure(
            QStringLiteral("The pixels are of another type than the cached metadata says"));
    if (stored.pixels.size() != stored.rowStride() * stored.height ||
        numValues(stored) > std::numeric_limits<int>::max() / 2)
        return Result::failure(QStringLiteral("The image of %1 x %2 pixels is too large or incomplete")
                                   .arg(stored.width)
                                   .arg(stored.height));
    lattice = {stored.width, stored.height, 1, mType, {}};
    allocatePixels(lattice);
    const bool ok = visitPixelType(stored.type, [&](auto zero) {
        using T = decltype(zero);
        // Wider types were refused above; here they are only kept from being compiled.
        if constexpr (sizeof(T) <= 2)
            return convertAll(slice, valuesOf<T>(stored), lattice, counts);
        else
            return false;
    });
    return ok ? Result()
              : Result::failure(QStringLiteral("A pixel exceeds the %1 bits stored").arg(slice.bitsStored));
}

}  // namespace Kdd
