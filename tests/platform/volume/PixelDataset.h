#pragma once

#include "platform/volume/KxVolumeInfo.h"
#include "platform/volume/PixelTypes.h"
#include "platform/volume/StoredFrame.h"

#include <QByteArray>
#include <QVector>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcpixseq.h>
#include <dcmtk/dcmdata/dcpxitem.h>
#include <dcmtk/dcmdata/dctk.h>

#include <memory>
#include <vector>

namespace Kdd
{

/// An image of a few pixels: `PixelDataset(2, 3, 16).with(DCM_BitsStored, "12").words({...})`. Grey, unsigned, with all
/// bits stored unless a test says otherwise.
class PixelDataset
{
public:
    PixelDataset(int rows, int columns, int bitsAllocated)
    {
        with(DCM_Rows, QByteArray::number(rows)).with(DCM_Columns, QByteArray::number(columns));
        with(DCM_BitsAllocated, QByteArray::number(bitsAllocated)).with(DCM_SamplesPerPixel, "1");
        with(DCM_PixelRepresentation, "0").with(DCM_PhotometricInterpretation, "MONOCHROME2");
    }

    PixelDataset& with(const DcmTag& tag, const QByteArray& value)
    {
        mDataset->putAndInsertString(tag, value.constData());
        return *this;
    }

    PixelDataset& colour(const QByteArray& photometric)
    {
        return with(DCM_SamplesPerPixel, "3").with(DCM_PhotometricInterpretation, photometric);
    }

    PixelDataset& bytes(const std::vector<Uint8>& values, const DcmTagKey& key = DCM_PixelData)
    {
        mDataset->putAndInsertUint8Array(DcmTag(key, EVR_OB), values.data(),
                                         static_cast<unsigned long>(values.size()));
        return *this;
    }

    PixelDataset& words(const std::vector<Uint16>& values, const DcmTagKey& key = DCM_PixelData)
    {
        mDataset->putAndInsertUint16Array(DcmTag(key, EVR_OW), values.data(),
                                          static_cast<unsigned long>(values.size()));
        return *this;
    }

    /// Look-up tables: the descriptor's three numbers, in the dataset or an item of a sequence of it.
    PixelDataset& numbers(const DcmTagKey& key, const std::vector<Uint16>& values)
    {
        mDataset->putAndInsertUint16Array(DcmTag(key, EVR_US), values.data(),
                                          static_cast<unsigned long>(values.size()));
        return *this;
    }

    PixelDataset& withItem(const DcmTagKey& sequence, const PixelDataset& item)
    {
        mDataset->insertSequenceItem(sequence, new DcmItem(*item.mDataset));
        return *this;
    }

    static PixelDataset item() { return {}; }

    DcmDataset& dataset() const { return *mDataset; }

private:
    PixelDataset() = default;

    std::shared_ptr<DcmDataset> mDataset = std::make_shared<DcmDataset>();
};

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
