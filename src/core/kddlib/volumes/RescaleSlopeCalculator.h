#pragma once

#include "platform/base/Export.h"

#include <limits>

namespace Kdd
{

/// Finds one slope and intercept for images that bring their own.
///
/// A volume is loaded into one buffer of unsigned values, while its images may differ in Rescale Slope,
/// Rescale Intercept and bit depth. Every image is added once; the results then say how the range of physical
/// values that all of them can reach maps onto the buffer, and how many bits the coarsest step costs.
///
/// Signed stored values are thought of as moved up by half the buffer's range, so that they are unsigned;
/// intercepts count from there. Images that all agree keep their slope and (moved) intercept and lose
/// nothing.
///
/// A value; const operations may run on several threads at once.
class KDD_EXPORT RescaleSlopeCalculator
{
public:
    /// `mode` 1 or less: a buffer of 8 bits; 2 or more: 16 bits.
    explicit RescaleSlopeCalculator(int mode = 2)
        : mMode(mode)
    {
    }

    /// Adds an image of `bitsStored` bits. An image of slope 1 and intercept 0 never widens the physical
    /// range, even when it is signed and other images differ.
    void add(float slope, float intercept, int bitsStored, bool isSigned);

    /// Physical values outside are clamped. Counts for images that are added later.
    void setPhysRangeMin(float value) { mPhysRangeMin = value; }
    void setPhysRangeMax(float value) { mPhysRangeMax = value; }

    /// The physical values reached; the minimum lies above the maximum when no image widened the range.
    float physMin() const { return mPhysMin; }
    float physMax() const { return mPhysMax; }

    /// How many limits of images were clamped.
    int numRangeClamped() const { return mRangeClampedCount; }

    /// 1, 0 and 0 when no image was added. Images that differ although none widened the range give a slope of
    /// minus infinity.
    float rescaleSlope() const;
    float rescaleIntercept() const;

    /// At most the largest `bitsStored` [bits].
    float precisionBitLoss() const;

private:
    bool isWide() const { return mMode >= 2; }
    int signedOffset() const { return isWide() ? 32768 : 128; }
    float step() const;
    void compareWithFirst(float slope, float intercept, int bitsStored);
    void widenRange(float low, float high);

    float mPhysRangeMin = std::numeric_limits<float>::lowest();
    float mPhysRangeMax = std::numeric_limits<float>::max();
    float mPhysMin = std::numeric_limits<float>::max();
    float mPhysMax = std::numeric_limits<float>::lowest();
    float mFirstSlope = 1;
    float mFirstIntercept = 0;
    float mMinAbsSlope = 1;
    int mMode;
    int mMaxBits = 0;
    int mRangeClampedCount = 0;
    bool mAllEqual = true;
    bool mHasFirst = false;
};

}  // namespace Kdd
