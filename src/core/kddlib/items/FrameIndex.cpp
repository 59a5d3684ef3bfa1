#include "kddlib/items/FrameIndex.h"

#include "kddlib/items/ElementWalk.h"
#include "kddlib/items/FrameIndexData.h"
#include "platform/volume/FragmentReader.h"
#include "platform/volume/NativeFrame.h"

#include <QtEndian>

#include <algorithm>

namespace Kdd
{

namespace
{

constexpr int kMagicBytes = 12;  // by which a codestream is recognised

Result readAll(MediaSource& file, const FileStretch& stretch, char* to)
{
    for (qint64 done = 0; done < stretch.length;) {
        const qint64 got = file.read(stretch.offset + done, to + done, stretch.length - done);
        if (got <= 0)
            return Result::failure(QStringLiteral("The file ends early or cannot be read"));
        done += got;
    }
    return {};
}

/// The numbers of a table of offsets that has one for each frame; empty when it does not.
template <typename Number>
QVector<qint64> readTable(MediaSource& file, const FileStretch& table, int frames)
{
    QVector<qint64> offsets;
    if (table.length / qint64(sizeof(Number)) != frames)
        return offsets;
    QByteArray bytes(static_cast<int>(table.length), Qt::Uninitialized);
    if (readAll(file, table, bytes.data()).bad())
        return offsets;
    for (int i = 0; i < frames; ++i)
        offsets.append(
            static_cast<qint64>(qFromLittleEndian<Number>(bytes.constData() + i * int(sizeof(Number)))));
    return offsets;
}

/// The fragments that begin at the offsets, which count from the head of the first fragment; empty unless each offset
/// names one and they ascend from the first.
QVector<int> fragmentsAt(const QVector<qint64>& offsets, const QVector<FileStretch>& fragments)
{
    QVector<int> first;
    int fragment = 0;
    for (qint64 offset : offsets) {
        const qint64 at = offset + fragments.first().offset;
        while (fragment < fragments.size() && fragments.at(fragment).offset < at)
            ++fragment;
        const bool isFragment = fragment < fragments.size() && fragments.at(fragment).offset == at;
        if (!isFragment || (first.isEmpty() ? fragment != 0 : fragment == first.last()))
            return {};
        first.append(fragment);
    }
    return first;
}

/// Those that begin a codestream; empty unless there are just as many of them as frames.
QVector<int> fragmentsByStart(MediaSource& file, const QVector<FileStretch>& fragments, int frames)
{
    QVector<int> first;
    for (int i = 0; i < fragments.size(); ++i) {
        const FileStretch& fragment = fragments.at(i);
        QByteArray head(static_cast<int>(qMin<qint64>(kMagicBytes, fragment.length)), 0);
        if (readAll(file, {fragment.offset, head.size()}, head.data()).bad())
            return {};
        if (recognizeCodestream(head) != Codestream::Unknown)
            first.append(i);
    }
    return first.size() == frames && first.value(0, -1) == 0 ? first : QVector<int>();
}

QByteArray shifted(const QByteArray& bytes, int firstBit, qint64 bits)
{
    QByteArray moved(static_cast<int>((bits + 7) / 8), 0);
    for (int i = 0; i < moved.size(); ++i) {
        const unsigned next = i + 1 < bytes.size() ? quint8(bytes.at(i + 1)) : 0U;
        moved[i] = static_cast<char>(((quint8(bytes.at(i)) | (next << 8U)) >> unsigned(firstBit)) & 0xffU);
    }
    // The bits behind the last pixel belong to the next frame.
    if (bits % 8 != 0)
        moved[moved.size() - 1] =
            static_cast<char>(quint8(moved.at(moved.size() - 1)) & ((1U << (bits % 8)) - 1U));
    return moved;
}

}  // namespace

bool isVideoSyntax(const QByteArray& uid)
{
    constexpr char kFamily[] = "1.2.840.10008.1.2.4.10";
    // .100 to .108; JPEG XL begins at .110.
    return uid.size() == int(sizeof kFamily) && uid.startsWith(kFamily) && uid.at(uid.size() - 1) >= '0' &&
           uid.at(uid.size() - 1) <= '8';
}

void assignFragments(MediaSource& file, const FileStretch& basicTable, const FileStretch& extendedTable,
                     FrameIndex::Private& found)
{
    const QVector<FileStretch>& fragments = found.fragments;
    const int frames = found.frames;
    if (fragments.size() < frames)
        return;
    if (frames == 1) {
        found.firstFragments = {0};
        return;
    }
    // The tables come late, because many writers leave them empty and some fill them wrongly; how many fragments there
    // are cannot be wrong.
    if (fragments.size() == frames) {
        for (int i = 0; i < frames; ++i)
            found.firstFragments.append(i);
        return;
    }
    found.firstFragments = fragmentsAt(readTable<quint64>(file, extendedTable, frames), fragments);
    if (found.firstFragments.isEmpty())
        found.firstFragments = fragmentsAt(readTable<quint32>(file, basicTable, frames), fragments);
    if (found.firstFragments.isEmpty())
        found.firstFragments = fragmentsByStart(file, fragments, frames);
}

FrameIndex::FrameIndex()
    : d(std::make_shared<Private>())
{
}

FrameIndex::~FrameIndex() = default;
FrameIndex::FrameIndex(const FrameIndex&) = default;
FrameIndex& FrameIndex::operator=(const FrameIndex&) = default;

const QByteArray& FrameIndex::transferSyntaxUID() const
{
    return d->transferSyntaxUID;
}

const QByteArray& FrameIndex::studyInstanceUID() const
{
    return d->studyInstanceUID;
}

const QByteArray& FrameIndex::sopInstanceUID() const
{
    return d->sopInstanceUID;
}

qint64 FrameIndex::datasetOffset() const
{
    return d->dataset;
}

FileStretch FrameIndex::pixelElement() const
{
    return d->element;
}

FileStretch FrameIndex::pixelValue() const
{
    return d->value;
}

bool FrameIndex::isEncapsulated() const
{
    return d->isEncapsulated;
}

DcmTagKey FrameIndex::pixelKey() const
{
    return d->pixelKey;
}

QByteArray FrameIndex::pixelVr() const
{
    return d->pixelVr;
}

int FrameIndex::frames() const
{
    return d->frames;
}

qint64 FrameIndex::decodedBits() const
{
    return d->layoutFault.good() ? nativeFrameBits(d->layout, d->sharesChroma) : 0;
}

Result FrameIndex::bitsOf(int frame, qint64& first, qint64& bits) const
{
    if (frame < 0 || frame >= d->frames)
        return Result::failure(QStringLiteral("There is no frame %1").arg(qint64(frame) + 1));
    if (d->layoutFault.bad())
        return d->layoutFault;
    bits = nativeFrameBits(d->layout, d->sharesChroma);
    // Divided, not multiplied: a number of frames is a claim and the product may wrap.
    if (d->value.length * 8 / bits <= frame)
        return Result::failure(QStringLiteral("Pixel data of %1 bytes end before frame %2 does")
                                   .arg(d->value.length)
                                   .arg(qint64(frame) + 1));
    first = bits * frame;
    return {};
}

Result FrameIndex::locate(int frame, QVector<FileStretch>& stretches) const
{
    if (d->isEncapsulated)
        return locateFragments(frame, stretches);
    qint64 first = 0;
    qint64 bits = 0;
    const Result told = bitsOf(frame, first, bits);
    if (told.bad())
        return told;
    if (first % 8 != 0 || bits % 8 != 0)
        return Result::failure(QStringLiteral("The frame does not begin and end at whole bytes"));
    stretches = {{d->value.offset + first / 8, bits / 8}};
    return {};
}

Result FrameIndex::locateFragments(int frame, QVector<FileStretch>& stretches) const
{
    if (frame < 0 || frame >= d->frames)
        return Result::failure(QStringLiteral("There is no frame %1").arg(qint64(frame) + 1));
    if (d->firstFragments.isEmpty())
        return Result::failure(
            QStringLiteral("The %1 fragments of the pixel data do not show which frame they belong to")
                .arg(d->fragments.size()));
    const int first = d->firstFragments.at(frame);
    const int last = frame + 1 < d->frames ? d->firstFragments.at(frame + 1) : d->fragments.size();
    stretches = d->fragments.mid(first, last - first);
    return {};
}

Result FrameIndex::readStored(MediaSource& file, int frame, QByteArray& bytes) const
{
    QVector<FileStretch> stretches;
    qint64 first = 0;
    qint64 bits = 0;
    Result result = d->isEncapsulated ? locateFragments(frame, stretches) : bitsOf(frame, first, bits);
    if (result.bad())
        return result;
    if (!d->isEncapsulated)
        stretches = {{d->value.offset + first / 8, (first % 8 + bits + 7) / 8}};
    qint64 size = 0;
    for (const FileStretch& stretch : qAsConst(stretches))
        size += stretch.length;
    // What the file claims is held against a bound before memory is taken for it.
    if (size > kMaxFrameBytes)
        return Result::failure(QStringLiteral("A frame of %1 bytes is too large").arg(size));
    QByteArray read(static_cast<int>(size), Qt::Uninitialized);
    char* to = read.data();
    for (const FileStretch& stretch : qAsConst(stretches)) {
        result = readAll(file, stretch, to);
        if (result.bad())
            return result;
        to += stretch.length;
    }
    const bool isWhole = d->isEncapsulated || (first % 8 == 0 && bits % 8 == 0);
    bytes = isWhole ? read : shifted(read, static_cast<int>(first % 8), bits);
    return {};
}

bool FrameIndex::findValue(MediaSource& file, const QVector<ElementStep>& steps, FileStretch& value) const
{
    ByteWindow bytes(file);
    ElementWalk::Element element;
    if (!ElementWalk(bytes, d->isExplicit).find(steps, d->dataset, bytes.size(), element))
        return false;
    value = {element.value, element.length};
    return true;
}

qint64 FrameIndex::cost() const
{
    return qint64(sizeof(Private)) + d->fragments.capacity() * qint64(sizeof(FileStretch)) +
           d->firstFragments.capacity() * qint64(sizeof(int));
}

}  // namespace Kdd
