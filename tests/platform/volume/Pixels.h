#pragma once

#include "platform/volume/KxVolumeInfo.h"
#include "platform/volume/PixelTypes.h"
#include "platform/volume/StoredFrame.h"
#include "support/DatasetBuilder.h"

namespace Kdd
{

/// All numbers of a picture.
inline QVector<double> numbersOf(const TypedData2D& pixels)
{
    QVector<double> numbers;
    visitPixelType(pixels.type, [&](auto zero) {
        const auto* values = valuesOf<decltype(zero)>(pixels);
        for (qint64 i = 0; i < numValues(pixels); ++i)
            numbers.append(double(values[i]));
    });
    return numbers;
}

inline QVector<double> numbersOf(const KxVolumeInfo& info)
{
    const QByteArray bytes(info.pixels(), static_cast<int>(info.rowStride() * info.height()));
    return numbersOf(
        TypedData2D{info.width(), info.height(), info.componentCode(), info.primitiveType(), bytes});
}

}  // namespace Kdd
