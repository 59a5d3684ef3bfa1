#pragma once

#include "platform/base/TypedData2D.h"

namespace Kdd
{

/// From the lowest to the highest of some values, both included; empty when the lowest lies above the highest.
struct ValueRange
{
    double lowest = 1;
    double highest = 0;

    bool isEmpty() const { return !(lowest <= highest); }
    bool contains(double value) const { return lowest <= value && value <= highest; }

    /// More than touching.
    bool overlaps(const ValueRange& other) const
    {
        return !isEmpty() && !other.isEmpty() && lowest < other.highest && other.lowest < highest;
    }

    /// The range of slope * value + intercept.
    ValueRange scaled(double slope, double intercept) const;
};

/// As a float; the nearest one for what floats do not reach.
float toFloat(double value);

/// The range of all finite numbers of a picture but those in `padding`; of all finite ones when there are not two
/// different numbers else.
ValueRange rangeOf(const TypedData2D& pixels, const ValueRange& padding = {});

}  // namespace Kdd
