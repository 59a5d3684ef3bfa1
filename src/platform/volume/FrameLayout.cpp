#include "platform/volume/FrameLayout.h"

#include "platform/volume/ImageAttributes.h"
#include "platform/volume/PixelTypes.h"
#include "platform/volume/StoredFrame.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcdatset.h>
#include <dcmtk/dcmdata/dcdeftag.h>
#include <dcmtk/dcmdata/dcitem.h>

namespace Kdd
{

namespace
{

int numberOf(DcmItem& dataset, const DcmTagKey& key, int absent)
{
    Uint16 value = 0;
    return dataset.findAndGetUint16(key, value).good() ? value : absent;
}

Result checkBits(const FrameLayout& layout)
{
    const int bits = layout.bitsAllocated;
    const bool isKnown =
        layout.isFloat ? bits == 32 || bits == 64 : bits == 1 || bits == 8 || bits == 16 || bits == 32;
    if (!isKnown)
        return Result::failure(QStringLiteral("Pixels of %1 bits cannot be decoded").arg(bits));
    if (layout.samples != 1 && layout.samples != 3)
        return Result::failure(QStringLiteral("Pixels of %1 samples cannot be decoded").arg(layout.samples));
    return Result();
}

Result checkSize(const FrameLayout& layout)
{
    // All factors come from 16-bit numbers, so the product cannot wrap.
    if (layout.rows > 0 && layout.columns > 0 && layout.frameBytes() <= kMaxFrameBytes)
        return Result();
    return Result::failure(QStringLiteral("%1 columns and %2 rows are no size of an image")
                               .arg(layout.columns)
                               .arg(layout.rows));
}

/// Writers get these two wrong more often than they mean anything unusual by them.
void mendStoredBits(FrameLayout& layout)
{
    if (layout.bitsStored < 1 || layout.bitsStored > layout.bitsAllocated)
        layout.bitsStored = layout.bitsAllocated;
    if (layout.highBit < layout.bitsStored - 1 || layout.highBit >= layout.bitsAllocated)
        layout.highBit = layout.bitsStored - 1;
}

}  // namespace

PrimitiveType FrameLayout::type() const
{
    if (isFloat)
        return bitsAllocated == 64 ? PrimitiveType::Float64 : PrimitiveType::Float32;
    if (bitsAllocated <= 8)
        return isSigned && bitsAllocated == 8 ? PrimitiveType::Int8 : PrimitiveType::UInt8;
    if (bitsAllocated == 16)
        return isSigned ? PrimitiveType::Int16 : PrimitiveType::UInt16;
    return isSigned ? PrimitiveType::Int32 : PrimitiveType::UInt32;
}

TypedData2D FrameLayout::allocate() const
{
    TypedData2D pixels{columns, rows, samples, type(), {}};
    allocatePixels(pixels);
    return pixels;
}

Result readFrameLayout(DcmItem& dataset, FrameLayout& layout)
{
    layout.rows = numberOf(dataset, DCM_Rows, 0);
    layout.columns = numberOf(dataset, DCM_Columns, 0);
    // Where it is absent the image is grey.
    layout.samples = numberOf(dataset, DCM_SamplesPerPixel, 1);
    layout.frames = numberOfFrames(dataset);
    // Float images have an element of their own in place of Pixel Data, and it tells the bits.
    layout.isFloat = !dataset.tagExists(DCM_PixelData);
    const bool isDouble = layout.isFloat && dataset.tagExists(DCM_DoubleFloatPixelData);
    layout.bitsAllocated = layout.isFloat ? (isDouble ? 64 : 32) : numberOf(dataset, DCM_BitsAllocated, 0);
    layout.bitsStored = numberOf(dataset, DCM_BitsStored, layout.bitsAllocated);
    layout.highBit = numberOf(dataset, DCM_HighBit, layout.bitsStored - 1);
    layout.isSigned = numberOf(dataset, DCM_PixelRepresentation, 0) == 1;
    // Of a single sample the attribute means nothing.
    layout.isPlanar = layout.samples == 3 && numberOf(dataset, DCM_PlanarConfiguration, 0) == 1;
    const auto* whole = dynamic_cast<DcmDataset*>(&dataset);
    layout.isBigEndian = whole && whole->getOriginalXfer() == EXS_BigEndianExplicit;
    layout.photometric = textOf(dataset, DCM_PhotometricInterpretation);
    // First mended, then checked: what is left to refuse is only what nobody can decode.
    mendStoredBits(layout);
    const Result bits = checkBits(layout);
    return bits.bad() ? bits : checkSize(layout);
}

int numberOfFrames(DcmItem& dataset)
{
    Sint32 frames = 0;
    // One that is absent or not positive: there is a frame wherever there are pixels.
    return dataset.findAndGetSint32(DCM_NumberOfFrames, frames).good() && frames > 0 ? frames : 1;
}

}  // namespace Kdd
