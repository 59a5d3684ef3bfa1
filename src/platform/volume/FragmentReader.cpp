#include "platform/volume/FragmentReader.h"

#include "platform/volume/FrameLayout.h"

#include <QtEndian>

#include <dcmtk/dcmdata/dcpixel.h>
#include <dcmtk/dcmdata/dcpixseq.h>
#include <dcmtk/dcmdata/dcpxitem.h>

#include <algorithm>

namespace Kdd
{

namespace
{

using Items = QVector<DcmPixelItem*>;

// The longest of the marks below, the signature of a container.
constexpr int kMagicBytes = 12;
// Tag and length before each fragment, which the offsets count as well.
constexpr int kItemHeaderBytes = 8;

/// All items, the offset table first. The sequence finds items by their number step by step from its ends, so walking
/// that way would take quadratic time.
Items itemsOf(DcmPixelSequence& sequence)
{
    Items items;
    for (DcmObject* it = sequence.nextInContainer(nullptr); it; it = sequence.nextInContainer(it)) {
        auto* item = dynamic_cast<DcmPixelItem*>(it);
        if (item)
            items.append(item);
    }
    return items;
}

qint64 lengthOf(DcmPixelItem& item)
{
    return item.getLengthField();
}

bool readPart(DcmPixelItem& item, qint64 offset, char* out, qint64 length, DcmFileCache& file)
{
    return length == 0 || item.getPartialValue(out, static_cast<Uint32>(offset), static_cast<Uint32>(length),
                                               &file, EBO_LittleEndian)
                              .good();
}

QByteArray headOf(DcmPixelItem& item, DcmFileCache& file)
{
    QByteArray head(static_cast<int>(qMin<qint64>(kMagicBytes, lengthOf(item))), 0);
    return readPart(item, 0, head.data(), head.size(), file) ? head : QByteArray();
}

/// Where frames begin, counted from the first fragment; empty when the table does not name all frames in order.
QVector<quint32> readOffsetTable(DcmPixelItem& table, int frames, DcmFileCache& file)
{
    if (lengthOf(table) / qint64(sizeof(quint32)) < frames)
        return {};
    QVector<quint32> offsets(frames);
    const qint64 size = qint64(frames) * qint64(sizeof(quint32));
    if (!readPart(table, 0, reinterpret_cast<char*>(offsets.data()), size, file))
        return {};
    qFromLittleEndian<quint32>(offsets.data(), frames, offsets.data());
    const bool isAscending =
        std::adjacent_find(offsets.begin(), offsets.end(), std::greater_equal<>()) == offsets.end();
    return isAscending && offsets.first() == 0 ? offsets : QVector<quint32>();
}

Items selectByOffset(const Items& fragments, const QVector<quint32>& offsets, int frame)
{
    const qint64 begin = offsets.at(frame);
    const bool isLast = frame + 1 == offsets.size();
    Items selected;
    qint64 offset = 0;
    // A fragment belongs to the frame in whose stretch it begins.
    for (DcmPixelItem* item : fragments) {
        if (offset >= begin && (isLast || offset < qint64(offsets.at(frame + 1))))
            selected.append(item);
        offset += kItemHeaderBytes + lengthOf(*item);
    }
    return selected;
}

/// Without offsets: a frame reaches from one fragment that begins a codestream to the next such.
Items selectByStart(const Items& fragments, int frame, DcmFileCache& file)
{
    Items selected;
    int current = -1;
    for (DcmPixelItem* item : fragments) {
        if (recognizeCodestream(headOf(*item, file)) != Codestream::Unknown && ++current > frame)
            break;
        if (current == frame)
            selected.append(item);
    }
    return selected;
}

Items selectFragments(const Items& items, int frame, int frames, DcmFileCache& file)
{
    const Items fragments = items.mid(1);
    // The offset table comes late, because many writers leave it empty and some fill it wrongly; how many fragments
    // there are cannot be wrong.
    if (frames == 1)
        return fragments;
    if (fragments.size() == frames)
        return {fragments.at(frame)};
    const QVector<quint32> offsets = readOffsetTable(*items.first(), frames, file);
    return offsets.isEmpty() ? selectByStart(fragments, frame, file)
                             : selectByOffset(fragments, offsets, frame);
}

Result readFragments(const Items& fragments, DcmFileCache& file, QByteArray& bytes)
{
    qint64 size = 0;
    for (DcmPixelItem* item : fragments)
        size += lengthOf(*item);
    // What the file claims is held against a bound before memory is taken for it.
    if (size > kMaxFrameBytes)
        return Result::failure(QStringLiteral("A compressed frame of %1 bytes is too large").arg(size));
    bytes = QByteArray(static_cast<int>(size), Qt::Uninitialized);
    char* to = bytes.data();
    for (DcmPixelItem* item : fragments) {
        if (!readPart(*item, 0, to, lengthOf(*item), file))
            return Result::failure(QStringLiteral("Compressed pixel data cannot be read"));
        to += lengthOf(*item);
    }
    return Result();
}

}  // namespace

DcmPixelSequence* findFragments(DcmElement& pixelData, E_TransferSyntax& xfer)
{
    auto* data = dynamic_cast<DcmPixelData*>(&pixelData);
    if (!data)
        return nullptr;
    const DcmRepresentationParameter* parameter = nullptr;
    DcmPixelSequence* sequence = nullptr;
    data->getOriginalRepresentationKey(xfer, parameter);
    return data->getEncapsulatedRepresentation(xfer, parameter, sequence).good() ? sequence : nullptr;
}

Codestream recognizeCodestream(const QByteArray& bytes)
{
    // The start of an image and the first byte of the marker behind it.
    if (bytes.startsWith("\xff\xd8\xff"))
        return Codestream::Jpeg;
    // A bare codestream, or the signature of its container.
    if (bytes.startsWith("\xff\x4f\xff\x51") || bytes.startsWith(QByteArray("\0\0\0\x0cjP  \r\n\x87\n", 12)))
        return Codestream::Jpeg2000;
    if (bytes.startsWith("\xff\x0a") || bytes.startsWith(QByteArray("\0\0\0\x0cJXL \r\n\x87\n", 12)))
        return Codestream::JpegXl;
    return Codestream::Unknown;
}

Result readFrameBytes(DcmPixelSequence& sequence, int frame, int frames, QByteArray& bytes)
{
    const Items items = itemsOf(sequence);
    // The offset table alone is no picture.
    if (items.size() < 2)
        return Result::failure(QStringLiteral("The compressed pixel data are empty"));
    DcmFileCache file;
    const Items fragments = selectFragments(items, frame, frames, file);
    if (fragments.isEmpty()) {
        return Result::failure(
            QStringLiteral("The %1 fragments of the pixel data do not show where frame %2 begins")
                .arg(items.size() - 1)
                .arg(frame + 1));
    }
    return readFragments(fragments, file, bytes);
}

FragmentSource::FragmentSource(DcmPixelSequence& sequence)
{
    // The stream begins behind the offset table.
    for (DcmPixelItem* item : itemsOf(sequence).mid(1)) {
        mFragments.append({item, mSize, lengthOf(*item)});
        mSize += lengthOf(*item);
    }
}

qint64 FragmentSource::read(qint64 offset, char* out, qint64 length)
{
    if (offset < 0 || length < 0)
        return -1;
    if (offset >= mSize)
        return 0;
    // The last fragment that begins no later. An empty one begins where the next does and is passed over by
    // that.
    const auto next = std::upper_bound(mFragments.cbegin(), mFragments.cend(), offset,
                                       [](qint64 at, const Fragment& f) { return at < f.offset; });
    const Fragment& fragment = *(next - 1);
    // Not beyond the fragment: whoever wants more asks again.
    const qint64 count = qMin(length, fragment.offset + fragment.size - offset);
    return readPart(*fragment.item, offset - fragment.offset, out, count, mFile) ? count : -1;
}

}  // namespace Kdd
