#include "kddlib/volumes/RescaleSlopeCalculator.h"

#include <QtGlobal>

#include <cmath>

namespace Kdd
{

namespace
{

constexpr float kLog2OfE = 1.442695F;

/// Bit depths come from files: whatever they say, the shift is defined and the sum wraps within 32 bits.
quint32 powerOfTwo(int exponent)
{
    return 1U << (static_cast<quint32>(exponent) & 31U);
}

float asFloat(quint32 wrapped)
{
    return static_cast<float>(static_cast<qint32>(wrapped));
}

}  // namespace

/// Goes by the values that the bits allow, not by those that the pixels have: nothing has to be decoded for
/// it. Moving signed values up moves the intercept too, so that signed and unsigned images can be compared.
void RescaleSlopeCalculator::add(float slope, float intercept, int bitsStored, bool isSigned)
{
    float rawMin = 0;
    float rawMax = asFloat(powerOfTwo(bitsStored) - 1);
    float effectiveIntercept = intercept;
    if (isSigned) {
        const auto offset = static_cast<quint32>(signedOffset());
        const quint32 half = powerOfTwo(bitsStored - 1);
        rawMin = asFloat(offset - half);
        rawMax = asFloat(half - 1 + offset);
        effectiveIntercept = intercept - asFloat(offset) * slope;
    }
    compareWithFirst(slope, effectiveIntercept, bitsStored);
    // Stored values that are physical values already need no range of their own.
    if (slope != 1 || intercept != 0)
        widenRange(rawMin * slope + effectiveIntercept, rawMax * slope + effectiveIntercept);
}

void RescaleSlopeCalculator::compareWithFirst(float slope, float intercept, int bitsStored)
{
    // A slope of 0 says nothing about how fine the values are.
    if (mHasFirst) {
        mAllEqual = mAllEqual && slope == mFirstSlope && intercept == mFirstIntercept;
        if (slope != 0)
            mMinAbsSlope = qMin(mMinAbsSlope, std::fabs(slope));
        mMaxBits = qMax(mMaxBits, bitsStored);
        return;
    }
    mFirstSlope = slope;
    mFirstIntercept = intercept;
    mMinAbsSlope = slope != 0 ? std::fabs(slope) : 1;
    mMaxBits = bitsStored;
    mHasFirst = true;
}

void RescaleSlopeCalculator::widenRange(float low, float high)
{
    if (mPhysRangeMin > low) {
        ++mRangeClampedCount;
        low = mPhysRangeMin;
    }
    if (high > mPhysRangeMax) {
        ++mRangeClampedCount;
        high = mPhysRangeMax;
    }
    mPhysMin = qMin(mPhysMin, low);
    mPhysMax = qMax(mPhysMax, high);
}

/// The physical distance between two neighbouring values of the buffer.
float RescaleSlopeCalculator::step() const
{
    return (mPhysMax - mPhysMin) / (isWide() ? 65535.0F : 255.0F);
}

float RescaleSlopeCalculator::rescaleSlope() const
{
    return mAllEqual ? mFirstSlope : step();
}

float RescaleSlopeCalculator::rescaleIntercept() const
{
    return mAllEqual ? mFirstIntercept : mPhysMin;
}

/// How many times finer the finest image steps than the buffer does, as a power of two.
float RescaleSlopeCalculator::precisionBitLoss() const
{
    if (mAllEqual || mMinAbsSlope >= std::fabs(step()))
        return 0;
    return qMin(static_cast<float>(mMaxBits), std::log(std::fabs(step() / mMinAbsSlope)) * kLog2OfE);
}

}  // namespace Kdd
