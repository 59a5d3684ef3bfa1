#pragma once

#include "kddlib/volumes/StackFrame.h"
#include "platform/base/Result.h"
#include "platform/base/TypedData2D.h"
#include "platform/volume/KxHistogram.h"

#include <QVector>

namespace Kdd
{

/// How often each value of a lattice occurs.
class ValueCounts
{
public:
    static constexpr int kLowest = -32768;
    static constexpr int kHighest = 65535;

    /// `kLowest` <= value <= `kHighest`.
    void add(int value) { ++mCounts[value - kLowest]; }

    bool isEmpty() const;

    /// The smallest and the largest value counted; of nothing the limits, exchanged.
    int minimum() const;
    int maximum() const;

    /// The counts in at most 4096 bins of equal width from the minimum to the maximum, one for each value if they
    /// suffice.
    KxHistogram histogram() const;

private:
    QVector<quint64> mCounts = QVector<quint64>(kHighest - kLowest + 1);
};

/// Brings the pixels of all slices of a stack onto one lattice, where value * scale() + bias() is the physical value.
///
/// Slices that agree in rescale and sign keep their stored values to the bit. Any others are mapped onto the
/// whole range of 16 bits, so that all physical values the slices can reach have a place; that rounds them.
/// Where slices with padding are mapped, all padding becomes 0 and a measured value at least 1.
class StackValues
{
public:
    /// At least one slice.
    explicit StackValues(const QVector<StackFrame>& slices);

    PrimitiveType type() const { return mType; }
    double scale() const { return mScale; }
    double bias() const { return mBias; }

    /// What the mapping costs in the slice of the finest step [bits].
    double bitLoss() const { return mBitLoss; }

    /// Values of the lattice that are no measurements, both limits included.
    bool hasPadding() const { return mHasPadding; }
    bool hasPaddingRange() const { return mHasPadding && mHasPaddingRange; }
    int paddingMin() const { return mPaddingMin; }
    int paddingMax() const { return mPaddingMax; }

    /// Failure when the pixels are not what the slice says: of another type, or outside its bits.
    /// Counts all values but padding.
    Result convert(const StackFrame& slice, const TypedData2D& stored, TypedData2D& lattice,
                   ValueCounts& counts) const;

private:
    void keepStored(const QVector<StackFrame>& slices);
    void mapOntoCommon(const QVector<StackFrame>& slices);
    int mapped(const StackFrame& slice, int stored) const;
    bool isPadding(int value) const { return mHasPadding && value >= mPaddingMin && value <= mPaddingMax; }

    template <typename T>
    bool convertAll(const StackFrame& slice, const T* stored, TypedData2D& lattice,
                    ValueCounts& counts) const;

    PrimitiveType mType = PrimitiveType::UInt16;
    double mScale = 1;
    double mBias = 0;
    double mBitLoss = 0;
    int mLowest = 0;
    int mHighest = 65535;
    bool mIsMapped = false;
    bool mHasPadding = false;
    bool mHasPaddingRange = false;
    int mPaddingMin = 0;
    int mPaddingMax = 0;
};

}  // namespace Kdd
