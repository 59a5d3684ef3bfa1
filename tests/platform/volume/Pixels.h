#pragma once

#include "platform/volume/KxVolumeInfo.h"
#include "platform/volume/PixelTypes.h"
#include "platform/volume/StoredFrame.h"
#include "support/DatasetBuilder.h"

#include <QByteArray>
#include <QVector>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcpixseq.h>
#include <dcmtk/dcmdata/dcpxitem.h>

namespace Kdd
{

/// Compressed pixel data; the first part is the offset table.
inline std::unique_ptr<DcmPixelSequence> sequenceOf(const QVector<QByteArray>& parts)
{
    auto sequence = std::make_unique<DcmPixelSequence>(DcmTag(DCM_PixelData, EVR_OB));
    for (const QByteArray& part : parts) {
        auto* fragment = new DcmPixelItem(DcmTag(DCM_Item, EVR_OB));
        fragment->putUint8Array(reinterpret_cast<const Uint8*>(part.constData()),
                                static_cast<unsigned long>(part.size()));
        sequence->insert(fragment);
    }
    return sequence;
}

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
