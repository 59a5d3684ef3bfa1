#pragma once

#include "platform/base/TypedData2D.h"

#include <utility>

namespace Kdd
{

/// Calls `visit` with a zero of the C++ type that `type` stands for.
template <typename Visit>
auto visitPixelType(PrimitiveType type, Visit&& visit)
{
    switch (type) {
    case PrimitiveType::UInt8:
        break;
    case PrimitiveType::Int8:
        return std::forward<Visit>(visit)(qint8{});
    case PrimitiveType::UInt16:
        return std::forward<Visit>(visit)(quint16{});
    case PrimitiveType::Int16:
        return std::forward<Visit>(visit)(qint16{});
    case PrimitiveType::Int32:
        return std::forward<Visit>(visit)(qint32{});
    case PrimitiveType::UInt32:
        return std::forward<Visit>(visit)(quint32{});
    case PrimitiveType::Float64:
        return std::forward<Visit>(visit)(double{});
    case PrimitiveType::Float32:
        return std::forward<Visit>(visit)(float{});
    }
    return std::forward<Visit>(visit)(quint8{});
}

/// The numbers of a picture as what they are; T must be what `pixels.type` stands for.
template <typename T>
const T* valuesOf(const TypedData2D& pixels)
{
    return reinterpret_cast<const T*>(pixels.pixels.constData());
}

template <typename T>
T* valuesOf(TypedData2D& pixels)
{
    return reinterpret_cast<T*>(pixels.pixels.data());
}

inline qint64 numValues(const TypedData2D& pixels)
{
    return qint64(pixels.width) * pixels.height * pixels.components;
}

/// Gives the picture room for all its numbers; they are not set.
inline void allocatePixels(TypedData2D& pixels)
{
    pixels.pixels = QByteArray(static_cast<int>(pixels.rowStride() * pixels.height), Qt::Uninitialized);
}

}  // namespace Kdd
