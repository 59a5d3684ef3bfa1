#include "server/browser/VolumeJson.h"

#include <QJsonArray>
#include <QtMath>

#include <kddlib/Volume.h>

#include <array>
#include <cmath>

namespace Kdd::Browser
{
namespace
{

// As wide as the page draws it.
constexpr int kShownBins = 96;

using Direction = std::array<double, 3>;

/// JSON has no word for what is no number.
QJsonValue number(double value)
{
    return std::isfinite(value) ? QJsonValue(value) : QJsonValue();
}

QJsonArray numbers(const Direction& values)
{
    return {number(values[0]), number(values[1]), number(values[2])};
}

/// What one step along an axis of the volume is in patient space.
Direction step(const Mat4f& matrix, int axis)
{
    const auto at = [&](int row) { return double(matrix.m.at(static_cast<size_t>(row * 4 + axis))); };
    return {at(0), at(1), at(2)};
}

double lengthOf(const Direction& direction)
{
    return std::hypot(direction[0], direction[1], direction[2]);
}

Direction unit(const Direction& direction)
{
    const double length = lengthOf(direction);
    return length > 0 ? Direction{direction[0] / length, direction[1] / length, direction[2] / length}
                      : direction;
}

Direction normalOf(const Direction& a, const Direction& b)
{
    return unit({a[1] * b[2] - a[2] * b[1], a[2] * b[0] - a[0] * b[2], a[0] * b[1] - a[1] * b[0]});
}

void addPlane(QJsonObject& object, const Direction& normal)
{
    static const char* const kPlanes[] = {"sagittal", "coronal", "axial"};
    int nearest = 0;
    for (int axis = 1; axis < 3; ++axis)
        if (std::abs(normal[static_cast<size_t>(axis)]) > std::abs(normal[static_cast<size_t>(nearest)]))
            nearest = axis;
    const double cosine = std::abs(normal[static_cast<size_t>(nearest)]);
    if (!std::isfinite(cosine) || cosine == 0)
        return;
    object.insert(QStringLiteral("plane"), QLatin1String(kPlanes[nearest]));
    object.insert(QStringLiteral("oblique"), qRadiansToDegrees(std::acos(qMin(cosine, 1.0))));
}

void addGeometry(QJsonObject& object, const Volume& volume)
{
    Mat4f matrix;
    volume.getTransformationMatrix(matrix);
    Box3f box;
    volume.getBoundingBox(box);
    const Direction steps[] = {step(matrix, 0), step(matrix, 1), step(matrix, 2)};
    const Vec3i dims = volume.dims();
    object.insert(QStringLiteral("dims"), QJsonArray{dims.x, dims.y, dims.z});
    object.insert(QStringLiteral("spacing"),
                  numbers({lengthOf(steps[0]), lengthOf(steps[1]), lengthOf(steps[2])}));
    object.insert(QStringLiteral("origin"), numbers(step(matrix, 3)));
    object.insert(QStringLiteral("axes"),
                  QJsonArray{numbers(unit(steps[0])), numbers(unit(steps[1])), numbers(unit(steps[2]))});
    addPlane(object, normalOf(unit(steps[0]), unit(steps[1])));
    object.insert(QStringLiteral("box"), QJsonArray{QJsonArray{number(box.xmin), number(box.xmax)},
                                                    QJsonArray{number(box.ymin), number(box.ymax)},
                                                    QJsonArray{number(box.zmin), number(box.zmax)}});
}

void addHistogram(QJsonObject& object, const KxHistogram& histogram)
{
    if (histogram.numBins() == 0 || histogram.total() == 0)
        return;
    const int shown = qMin(kShownBins, histogram.numBins());
    QVector<double> sums(shown);
    for (int i = 0; i < histogram.numBins(); ++i)
        sums[static_cast<int>(qint64(i) * shown / histogram.numBins())] += double(histogram.bins().at(i));
    QJsonArray bins;
    for (const double sum : sums)
        bins.append(sum);
    object.insert(QStringLiteral("histogram"),
                  QJsonObject{{QStringLiteral("min"), number(histogram.minimum())},
                              {QStringLiteral("max"), number(histogram.maximum())},
                              {QStringLiteral("total"), double(histogram.total())},
                              {QStringLiteral("bins"), bins}});
}

void addValues(QJsonObject& object, const Volume& volume)
{
    object.insert(QStringLiteral("slope"), number(double(volume.rescaleSlope())));
    object.insert(QStringLiteral("intercept"), number(double(volume.rescaleIntercept())));
    object.insert(QStringLiteral("bitLoss"), number(double(volume.precisionBitLoss())));
    if (volume.paddingValue())
        object.insert(QStringLiteral("padding"), *volume.paddingValue());
    if (volume.paddingRangeLimit())
        object.insert(QStringLiteral("paddingLimit"), *volume.paddingRangeLimit());
}

}  // namespace

QJsonObject volumeJson(const Volume& volume)
{
    QJsonObject object{{QStringLiteral("index"), volume.volumeIndex()},
                       {QStringLiteral("images"), volume.numImages()},
                       {QStringLiteral("preview"), volume.hasPreview()}};
    if (volume.isBareVolume()) {
        object.insert(QStringLiteral("bare"), true);
        return object;
    }
    object.insert(QStringLiteral("slices"), volume.slices().size());
    object.insert(QStringLiteral("lossy"), volume.numLossyCompressedImages());
    object.insert(QStringLiteral("overlays"), volume.numOverlayPlanes());
    addGeometry(object, volume);
    addValues(object, volume);
    addHistogram(object, volume.histogram());
    return object;
}

}  // namespace Kdd::Browser
