#include "platform/volume/CompressedFrame.h"
#include "platform/volume/FrameLayout.h"
#include "platform/volume/NativeFrame.h"

#include <QVector>
#include <QtEndian>

#include <dcmtk/dcmdata/dcrledec.h>

namespace Kdd
{

namespace
{

// The number of segments and places for fifteen offsets, 32 bits each.
constexpr int kHeaderBytes = 64;
constexpr int kMaxSegments = 15;

Result damaged(const QString& what)
{
    return Result::failure(QStringLiteral("RLE data are damaged: ") + what);
}

/// Where the segments begin, and where the last one ends; empty when the header contradicts itself.
QVector<qint64> readSegments(const QByteArray& bytes)
{
    if (bytes.size() < kHeaderBytes)
        return {};
    const auto count = qFromLittleEndian<quint32>(bytes.constData());
    if (count < 1 || count > kMaxSegments)
        return {};
    QVector<qint64> bounds;
    qint64 least = kHeaderBytes;
    for (int i = 1; i <= int(count); ++i) {
        bounds.append(qFromLittleEndian<quint32>(bytes.constData() + 4 * i));
        if (bounds.last() < least || bounds.last() > bytes.size())
            return {};
        least = bounds.last();
    }
    bounds.append(bytes.size());
    return bounds;
}

/// Expands a segment to every `step`th byte of the frame, from the one at `at`.
bool expandSegment(QByteArray segment, int at, int step, QByteArray& frame)
{
    const int count = frame.size() / step;
    DcmRLEDecoder decoder(static_cast<size_t>(count));
    // A run that is left open at the end, or bytes more than the frame takes, are padding.
    (void)decoder.decompress(segment.data(), static_cast<size_t>(segment.size()));
    if (decoder.size() != static_cast<size_t>(count))
        return false;
    const char* from = static_cast<const char*>(decoder.getOutputBuffer());
    char* to = frame.data() + at;
    for (int i = 0; i < count; ++i)
        to[qint64(i) * step] = from[i];
    return true;
}

}  // namespace

/// Each byte of each sample is a segment of its own, the highest byte first.
Result decodeRle(const QByteArray& bytes, const FrameLayout& layout, StoredFrame& out)
{
    const int width = qMax(1, layout.bitsAllocated / 8);
    const int step = width * layout.samples;
    const QVector<qint64> bounds = readSegments(bytes);
    // The number of segments is told by the header and by the dataset, which must agree.
    if (bounds.size() != step + 1)
        return damaged(QStringLiteral("segments do not match %1 bytes per pixel").arg(step));

    const qint64 size = (nativeFrameBits(layout, false) + 7) / 8;
    QByteArray frame(static_cast<int>(size), Qt::Uninitialized);
    for (int i = 0; i < step; ++i) {
        const auto from = static_cast<int>(bounds.at(i));
        const QByteArray segment = bytes.mid(from, static_cast<int>(bounds.at(i + 1)) - from);
        // Within a sample the highest byte comes first and belongs last.
        const int at = i / width * width + width - 1 - i % width;
        if (!expandSegment(segment, at, step, frame))
            return damaged(QStringLiteral("segment %1 is too short").arg(i + 1));
    }
    // Each segment was put in its place, so the samples stand side by side, however the dataset calls them.
    FrameLayout sideBySide = layout;
    sideBySide.isPlanar = false;
    out.pixels = unpackFrame(frame, sideBySide, 0, false);
    return Result();
}

}  // namespace Kdd
