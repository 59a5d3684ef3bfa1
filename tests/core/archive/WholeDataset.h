#pragma once

#include "kddlib/archive/CorrectedDataset.h"
#include "support/ByteSource.h"

#include <gtest/gtest.h>

namespace Kdd
{

template <typename Producer>
QByteArray allOf(Producer producer)
{
    QByteArray bytes;
    QByteArray block;
    do {
        const Result made = producer.next(block);
        EXPECT_TRUE(made.good()) << qPrintable(made.text());
        if (made.bad())
            break;
        bytes += block;
    } while (!block.isEmpty());
    return bytes;
}

/// A corrected file in one piece.
inline QByteArray wholeOf(const CorrectedDataset& dataset, ByteSource& source, const FrameIndex& index,
                          const QByteArray& syntaxUID)
{
    using Pixels = CorrectedDataset::Pixels;
    QByteArray bytes = dataset.head();
    if (dataset.pixels() == Pixels::Stored)
        bytes += source.bytes().mid(static_cast<int>(index.pixelValue().offset),
                                    static_cast<int>(index.pixelValue().length));
    if (dataset.pixels() == Pixels::Decoded)
        bytes += allOf(DecodedPixels(source, index));
    if (dataset.pixels() == Pixels::Encoded)
        bytes += allOf(EncodedPixels(source, index, syntaxUID));
    return bytes + dataset.tail();
}

}  // namespace Kdd
