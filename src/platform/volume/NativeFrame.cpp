#include "platform/volume/NativeFrame.h"

#include "platform/volume/FrameLayout.h"
#include "platform/volume/PixelTypes.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcelem.h>

#include <algorithm>
#include <cstring>
#include <type_traits>

namespace Kdd
{

namespace
{

void unpackBits(const QByteArray& bytes, int firstBit, TypedData2D& pixels)
{
    auto* to = valuesOf<quint8>(pixels);
    const auto* from = reinterpret_cast<const quint8*>(bytes.constData());
    const qint64 count = numValues(pixels);
    for (qint64 i = 0; i < count; ++i) {
        const qint64 bit = firstBit + i;
        // The first pixel is the lowest bit.
        to[i] = (from[bit / 8] >> (bit % 8)) & 1U;
    }
}

/// One plane for each sample becomes samples side by side.
template <typename T>
void interleave(const char* from, TypedData2D& pixels)
{
    const qint64 size = numValues(pixels) / pixels.components;
    T* to = valuesOf<T>(pixels);
    for (int plane = 0; plane < pixels.components; ++plane) {
        for (qint64 i = 0; i < size; ++i)
            std::memcpy(to + i * pixels.components + plane, from + (plane * size + i) * qint64(sizeof(T)),
                        sizeof(T));
    }
}

/// Two pixels are stored as Y Y Cb Cr.
template <typename T>
void spreadChroma(const char* from, TypedData2D& pixels)
{
    T* to = valuesOf<T>(pixels);
    const qint64 pairs = qint64(pixels.width) * pixels.height / 2;
    for (qint64 i = 0; i < pairs; ++i, to += 6) {
        T pair[4];
        std::memcpy(pair, from + i * qint64(sizeof pair), sizeof pair);
        to[0] = pair[0];
        to[3] = pair[1];
        to[1] = to[4] = pair[2];
        to[2] = to[5] = pair[3];
    }
}

bool mayShareChroma(const FrameLayout& layout)
{
    const bool is422 = layout.photometric == "YBR_FULL_422" || layout.photometric == "YBR_PARTIAL_422";
    return is422 && layout.samples == 3 && !layout.isPlanar && !layout.isFloat && layout.columns % 2 == 0;
}

/// Wide pixels come as words: the order within a word is the machine's by now, that of the words is still the file's.
void swapWords(QByteArray& bytes)
{
    for (int i = 0; i + 4 <= bytes.size(); i += 4)
        std::swap_ranges(bytes.data() + i, bytes.data() + i + 2, bytes.data() + i + 2);
}

}  // namespace

qint64 nativeFrameBits(const FrameLayout& layout, bool sharesChroma)
{
    // Two pixels take four values in place of six.
    const qint64 values = sharesChroma ? layout.numValues() / 3 * 2 : layout.numValues();
    return values * layout.bitsAllocated;
}

bool sharesChroma(const FrameLayout& layout, qint64 length)
{
    return mayShareChroma(layout) && length * 8 / nativeFrameBits(layout, false) < layout.frames;
}

TypedData2D unpackFrame(const QByteArray& bytes, const FrameLayout& layout, int firstBit, bool sharesChroma)
{
    TypedData2D pixels = layout.allocate();
    if (layout.bitsAllocated == 1) {
        unpackBits(bytes, firstBit, pixels);
        return pixels;
    }
    visitPixelType(pixels.type, [&](auto zero) {
        using T = decltype(zero);
        if (sharesChroma)
            spreadChroma<T>(bytes.constData(), pixels);
        else if (layout.isPlanar)
            interleave<T>(bytes.constData(), pixels);
        else if (bytes.size() == pixels.pixels.size())
            pixels.pixels = bytes;
        else
            std::memcpy(pixels.pixels.data(), bytes.constData(), static_cast<size_t>(pixels.pixels.size()));
    });
    if (!layout.isFloat)
        keepStoredBits(pixels, layout.bitsStored, layout.highBit);
    return pixels;
}

void keepStoredBits(TypedData2D& pixels, int stored, int highBit)
{
    visitPixelType(pixels.type, [&](auto zero) {
        using T = decltype(zero);
        if constexpr (std::is_integral_v<T>) {
            constexpr int kBits = 8 * int(sizeof(T));
            if (stored >= kBits)
                return;
            // Up to the top and down again: the way down repeats the sign of a signed type.
            const int up = kBits - 1 - highBit;
            T* value = valuesOf<T>(pixels);
            for (const T* end = value + numValues(pixels); value != end; ++value) {
                const auto raised = static_cast<std::make_unsigned_t<T>>(quint64(*value) << up);
                *value = static_cast<T>(static_cast<T>(raised) >> (kBits - stored));
            }
        }
    });
}

Result readNativeFrame(DcmElement& pixelData, const FrameLayout& layout, int frame, StoredFrame& out)
{
    const qint64 length = pixelData.getLengthField();
    const bool isShared = sharesChroma(layout, length);
    const qint64 bits = nativeFrameBits(layout, isShared);
    // Divided, not multiplied: a frame number is a claim and the product may wrap.
    if (length * 8 / bits <= frame)
        return Result::failure(QStringLiteral("Pixel data of %1 bytes end before frame %2 does")
                                   .arg(length)
                                   .arg(qint64(frame) + 1));
    // Frames of single bits follow each other without padding, so one may begin within a byte.
    const qint64 first = bits * frame / 8;
    const qint64 last = (bits * (qint64(frame) + 1) + 7) / 8;

    // Words are swapped as a whole where the file has the other byte order, so whole words are asked for.
    const qint64 from = first - first % 8;
    const qint64 to = qMin(length, last + 7 - (last + 7) % 8);
    QByteArray bytes(static_cast<int>(to - from), Qt::Uninitialized);
    const OFCondition read =
        pixelData.getPartialValue(bytes.data(), static_cast<Uint32>(from), static_cast<Uint32>(to - from));
    if (read.bad())
        return Result::failure(QStringLiteral("Pixel data cannot be read: ") + QLatin1String(read.text()));
    if (layout.isBigEndian && layout.bitsAllocated == 32 && pixelData.getVR() == EVR_OW)
        swapWords(bytes);
    if (first != from)
        bytes.remove(0, static_cast<int>(first - from));
    out.pixels = unpackFrame(bytes, layout, static_cast<int>(bits * frame % 8), isShared);
    return Result();
}

}  // namespace Kdd
