#pragma once

#include <QVector>

#include <limits>

namespace Kdd
{

/// How often the values of a volume occur: bins of equal width between a minimum and a maximum, both in
/// stored values. The first bin begins at the minimum, the last one ends at the maximum.
///
/// A value; copies share their bins.
class KxHistogram
{
public:
    /// No bins, and the range 0 to 0.
    KxHistogram() = default;

    KxHistogram(const QVector<quint64>& bins, double minimum, double maximum)
        : mBins(bins)
        , mMinimum(minimum)
        , mMaximum(maximum)
        , mTotal(sumOf(bins))
    {
    }

    int numBins() const { return mBins.size(); }
    const QVector<quint64>& bins() const { return mBins; }
    double minimum() const { return mMinimum; }
    double maximum() const { return mMaximum; }

    /// How many values were counted, at most 2^64 - 1.
    quint64 total() const { return mTotal; }

private:
    static quint64 sumOf(const QVector<quint64>& bins)
    {
        quint64 sum = 0;
        for (const quint64 bin : bins)
            sum = bin > std::numeric_limits<quint64>::max() - sum ? std::numeric_limits<quint64>::max()
                                                                  : sum + bin;
        return sum;
    }

    QVector<quint64> mBins;
    double mMinimum = 0;
    double mMaximum = 0;
    quint64 mTotal = 0;
};

}  // namespace Kdd
