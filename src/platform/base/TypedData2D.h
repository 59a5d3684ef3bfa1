#pragma once

#include <QByteArray>

namespace Kdd
{

/// What one number of a pixel is. The numbers stand in volume files and are never changed.
enum class PrimitiveType : int {
    UInt8 = 0,
    Int8 = 1,
    UInt16 = 2,
    Int16 = 3,
    Int32 = 4,
    UInt32 = 5,
    Float64 = 6,
    Float32 = 7,
};

/// Size of one number [bytes]; 0 for a code that stands for none.
constexpr int sizeOf(PrimitiveType type)
{
    switch (type) {
    case PrimitiveType::UInt8:
    case PrimitiveType::Int8:
        return 1;
    case PrimitiveType::UInt16:
    case PrimitiveType::Int16:
        return 2;
    case PrimitiveType::Int32:
    case PrimitiveType::UInt32:
    case PrimitiveType::Float32:
        return 4;
    case PrimitiveType::Float64:
        return 8;
    }
    return 0;
}

/// A rectangle of pixels: rows from top to bottom without padding between them, each pixel of `components` numbers
/// side by side, in the machine's byte order.
///
/// A value; copies share their pixels.
struct TypedData2D
{
    int width = 0;       ///< [pixels]
    int height = 0;      ///< [pixels]
    int components = 1;  ///< numbers per pixel
    PrimitiveType type = PrimitiveType::UInt8;
    QByteArray pixels;  ///< rowStride() * height bytes, or nothing

    bool isEmpty() const { return pixels.isEmpty(); }
    int bytesPerPixel() const { return sizeOf(type) * components; }
    qint64 rowStride() const { return qint64(width) * bytesPerPixel(); }
};

}  // namespace Kdd
