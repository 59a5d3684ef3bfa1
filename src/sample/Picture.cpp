#include "sample/Picture.h"

#include "sample/Dataset.h"
#include "sample/Random.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdeftag.h>

#include <algorithm>
#include <cmath>

namespace Kdd
{

namespace
{

// Unlike std::hypot, the square root is the same to the last bit everywhere.
double length(double x, double y)
{
    return std::sqrt(x * x + y * y);
}

// How far (x, y), counted from the centre, lies within the edge; negative outside. Exact at the edge, where
// it matters.
double depthWithin(const SampleEllipse& ellipse, double x, double y)
{
    // In the ellipse's own measure the edge has the distance 1 from the centre.
    const double partX = x / ellipse.radiusX;
    const double partY = y / ellipse.radiusY;
    const double part = length(partX, partY);
    const double slope = length(partX / ellipse.radiusX, partY / ellipse.radiusY);
    // In the centre itself no direction leads to the edge.
    return slope > 0 ? (1 - part) * part / slope : std::min(ellipse.radiusX, ellipse.radiusY);
}

}  // namespace

SamplePicture::SamplePicture(int columns, int rows, double background)
    : mColumns(columns)
    , mRows(rows)
    , mPixels(columns * rows, background)
{
}

SamplePicture& SamplePicture::paint(const SampleEllipse& ellipse)
{
    // The shorter side counts, so that a circle is round in every picture.
    const double pixelsPerUnit = std::min(mColumns, mRows) / 2.0;
    double* pixel = mPixels.data();
    for (int row = 0; row < mRows; ++row) {
        const double y = (row + 0.5 - mRows / 2.0) / pixelsPerUnit - ellipse.y;
        for (int column = 0; column < mColumns; ++column, ++pixel) {
            const double x = (column + 0.5 - mColumns / 2.0) / pixelsPerUnit - ellipse.x;
            // How much of the pixel the ellipse covers: the edge is one pixel wide.
            const double cover = std::clamp(depthWithin(ellipse, x, y) * pixelsPerUnit + 0.5, 0.0, 1.0);
            *pixel += (ellipse.value - *pixel) * cover;
        }
    }
    return *this;
}

SamplePicture& SamplePicture::addNoise(SampleRandom& random, double amplitude)
{
    for (double& pixel : mPixels)
        pixel += amplitude * random.noise();
    return *this;
}

QVector<Uint16> SamplePicture::words(int offset, int lowest, int highest) const
{
    QVector<Uint16> words;
    words.reserve(mPixels.size());
    for (const double pixel : mPixels) {
        const int value = std::clamp(static_cast<int>(std::lround(pixel)) + offset, lowest, highest);
        words.append(static_cast<Uint16>(value & 0xFFFF));
    }
    return words;
}

void SamplePicture::addUnsigned(SampleDataset& dataset, int offset, int bitsStored) const
{
    const QVector<Uint16> pixels = words(offset, 0, (1 << bitsStored) - 1);
    const auto range = std::minmax_element(pixels.begin(), pixels.end());
    add(dataset, pixels, bitsStored);
    // The last two name their representation, since the dictionary leaves it to the pixels.
    dataset.with(DCM_PixelRepresentation, 0)
        .with(DcmTag(DCM_SmallestImagePixelValue, EVR_US), *range.first)
        .with(DcmTag(DCM_LargestImagePixelValue, EVR_US), *range.second);
}

void SamplePicture::addSigned(SampleDataset& dataset) const
{
    // All that sixteen bits hold: nothing that is painted comes near.
    add(dataset, words(0, -32768, 32767), 16);
    const auto range = std::minmax_element(mPixels.begin(), mPixels.end());
    dataset.with(DCM_PixelRepresentation, 1)
        .with(DcmTag(DCM_SmallestImagePixelValue, EVR_SS), static_cast<int>(std::lround(*range.first)))
        .with(DcmTag(DCM_LargestImagePixelValue, EVR_SS), static_cast<int>(std::lround(*range.second)));
}

void SamplePicture::add(SampleDataset& dataset, const QVector<Uint16>& words, int bitsStored) const
{
    dataset.with(DCM_SamplesPerPixel, 1)
        .with(DCM_Rows, mRows)
        .with(DCM_Columns, mColumns)
        .with(DCM_BitsAllocated, 16)
        .with(DCM_BitsStored, bitsStored)
        .with(DCM_HighBit, bitsStored - 1)
        .withWords(DcmTag(DCM_PixelData, EVR_OW), words);
}

}  // namespace Kdd
