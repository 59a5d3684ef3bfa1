#pragma once

#include <QVector>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/ofstd/oftypes.h>

#include <cstddef>

namespace Kdd
{

class SampleDataset;
class SampleRandom;

/// The centre of a picture is (0, 0) and half its shorter side is 1 long; x grows to the right, y downwards.
struct SampleEllipse
{
    double x;
    double y;
    double radiusX;
    double radiusY;
    double value;
};

/// A grey picture painted of ellipses with soft edges.
class SamplePicture
{
public:
    SamplePicture(int columns, int rows, double background);

    int columns() const { return mColumns; }
    int rows() const { return mRows; }

    SamplePicture& paint(const SampleEllipse& ellipse);

    template <std::size_t N>
    SamplePicture& paintAll(const SampleEllipse (&ellipses)[N])
    {
        for (const SampleEllipse& ellipse : ellipses)
            paint(ellipse);
        return *this;
    }

    /// Adds to every pixel up to `amplitude`, or takes it away.
    SamplePicture& addNoise(SampleRandom& random, double amplitude);

    /// The pixels plus `offset`, rounded and held within `lowest`..`highest`; negative ones as two's
    /// complement.
    QVector<Uint16> words(int offset, int lowest, int highest) const;

    /// Adds Rows, Columns and the 16-bit Pixel Data of unsigned pixels that use `bitsStored` bits.
    void addUnsigned(SampleDataset& dataset, int offset, int bitsStored) const;

    /// The same with signed pixels of 16 bits.
    void addSigned(SampleDataset& dataset) const;

private:
    void add(SampleDataset& dataset, const QVector<Uint16>& words, int bitsStored) const;

    int mColumns;
    int mRows;
    QVector<double> mPixels;  // row by row
};

}  // namespace Kdd
