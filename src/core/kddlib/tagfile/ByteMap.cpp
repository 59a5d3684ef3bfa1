#include "kddlib/tagfile/ByteMap.h"

#include "kddlib/Limits.h"
#include "kddlib/tagfile/StoredStudy.h"
#include "kddlib/tagfile/format/BodyWalk.h"
#include "kddlib/tagfile/format/TagFileFrame.h"
#include "platform/compression/CompressedCosts.h"
#include "platform/compression/LzmaCompress.h"
#include "platform/compression/QxCompress.h"

#include <QDataStream>
#include <QtEndian>

namespace Kdd
{

namespace
{

constexpr int kLayoutAt = 6;
constexpr int kCompressionAt = 7;
constexpr int kHeaderSize = 8;
constexpr int kLengthSize = 4;
constexpr quint32 kNoBlob = 0xFFFFFFFF;

const char* const kDamaged = "Tag file has a damaged body";

quint32 numberAt(const QByteArray& content, int at)
{
    return qFromBigEndian<quint32>(content.constData() + at);
}

/// The pieces of a file, one behind the other.
struct Pieces
{
    QByteArray stored;
    QVector<int> blobs;  // with their lengths [bytes]
    int leftOver = 0;
};

/// Of a content whose reader took it, so that all but the table of blobs is known to be there.
Pieces piecesOf(const QByteArray& content)
{
    if (content.at(kLayoutAt) == kOldLayout)
        return {content.mid(kHeaderSize), {}, 0};
    Pieces pieces;
    int at = kHeaderSize + kLengthSize;
    pieces.stored = content.mid(at, static_cast<int>(numberAt(content, kHeaderSize)));
    at += pieces.stored.size();
    const bool hasTable = content.size() - at >= kLengthSize;
    const qint32 count = hasTable ? static_cast<qint32>(numberAt(content, at)) : 0;
    at += hasTable ? kLengthSize : 0;
    while (pieces.blobs.size() < count && content.size() - at >= kLengthSize) {
        const quint32 length = numberAt(content, at);
        const qint64 size = kLengthSize + (length == kNoBlob ? 0 : qint64(length));
        if (size > content.size() - at)
            break;
        pieces.blobs.append(static_cast<int>(size));
        at += static_cast<int>(size);
    }
    pieces.leftOver = content.size() - at;
    return pieces;
}

/// Brings what stretches of a body cost to the rows that they are spent for.
class Spending
{
public:
    Spending(const QVector<BodySpan>& spans, ByteRows& rows)
        : mSpans(spans)
        , mRows(rows)
        , mLeft(spans.isEmpty() ? 0 : spans.first().bytes)
    {
    }

    void take(qint64 bytes, qint64 bits)
    {
        const qint64 units = bits * ByteRows::kUnitsInBit;
        if (bytes == 0)
            mRows.at(ByteRows::of(ByteMap::Part::Frame)).units += units;
        for (qint64 done = 0; done < bytes && mAt < mSpans.size();) {
            const qint64 part = qMin(bytes - done, mLeft);
            // By differences, so that no unit gets lost in the divisions.
            mRows.at(mSpans.at(mAt).row).units += units * (done + part) / bytes - units * done / bytes;
            done += part;
            mLeft -= part;
            if (mLeft == 0 && ++mAt < mSpans.size())
                mLeft = mSpans.at(mAt).bytes;
        }
        mBytes += bytes;
        mUnits += units;
    }

    qint64 bytes() const { return mBytes; }
    qint64 units() const { return mUnits; }

private:
    const QVector<BodySpan>& mSpans;
    ByteRows& mRows;
    int mAt = 0;
    qint64 mLeft;
    qint64 mBytes = 0;
    qint64 mUnits = 0;
};

using Mode = TagFileSettings::CompressionMode;

QByteArray bodyOf(const QByteArray& stored, Mode mode)
{
    switch (mode) {
    case Mode::Zlib:
        return qxUncompress(stored, kMaxBodySize);
    case Mode::Lzma:
        return lzmaUncompress(stored, kMaxBodySize);
    case Mode::None:
        break;
    }
    return stored;
}

bool spend(const QByteArray& stored, Mode mode, Spending& spending)
{
    const auto tell = [&spending](qint64 bytes, qint64 bits) { spending.take(bytes, bits); };
    switch (mode) {
    case Mode::Zlib:
        return qxCosts(stored, tell);
    case Mode::Lzma:
        return lzmaCosts(stored, tell);
    case Mode::None:
        break;
    }
    for (int i = 0; i < stored.size(); ++i)
        tell(1, 8);
    return true;
}

}  // namespace

ByteMap::ByteMap()
    : mRows(std::make_unique<ByteRows>())
{
}

ByteMap::~ByteMap() = default;

Result ByteMap::addFile(const QString& path, const char* studyUID)
{
    StoredStudy study;
    QByteArray content;
    Result result = study.readContent(path, studyUID, content);
    return result.good() ? addSound(content) : result;
}

Result ByteMap::add(const QByteArray& content)
{
    StoredStudy study;
    QDataStream in(content);
    Result result = study.read(in, nullptr);
    return result.good() ? addSound(content) : result;
}

Result ByteMap::addSound(const QByteArray& content)
{
    const Pieces pieces = piecesOf(content);
    const auto mode = static_cast<Mode>(content.at(kCompressionAt));
    const QByteArray body = bodyOf(pieces.stored, mode);
    // Aside, so that a failure changes nothing.
    auto rows = std::make_unique<ByteRows>(*mRows);
    BodyParts parts;
    parts.namedByImage.fill(false, pieces.blobs.size());
    if (!walkBody(body, *rows, parts))
        return Result::failure(QLatin1String(kDamaged));
    Spending spending(parts.spans, *rows);
    if (!spend(pieces.stored, mode, spending) || spending.bytes() != body.size())
        return Result::failure(QLatin1String(kDamaged));

    qint64 around = qint64(content.size()) - pieces.stored.size() - pieces.leftOver;
    const auto add = [&rows](Part part, qint64 bytes) {
        ByteRows::Row& row = rows->at(ByteRows::of(part));
        ++row.entries;
        row.before += bytes;
        row.units += bytes * 8 * ByteRows::kUnitsInBit;
    };
    for (int i = 0; i < pieces.blobs.size(); ++i) {
        add(parts.namedByImage.at(i) ? Part::ImagePreviews : Part::VolumePreviews, pieces.blobs.at(i));
        around -= pieces.blobs.at(i);
    }
    add(Part::Frame, around);
    if (pieces.leftOver > 0)
        add(Part::LeftOver, pieces.leftOver);
    // Frame and checksum of the compressed body, of which its walk says nothing.
    rows->at(ByteRows::of(Part::Frame)).units +=
        qint64(pieces.stored.size()) * 8 * ByteRows::kUnitsInBit - spending.units();
    mRows = std::move(rows);
    ++mFiles;
    return {};
}

int ByteMap::files() const
{
    return mFiles;
}

QVector<ByteMap::Entry> ByteMap::entries() const
{
    constexpr qint64 kUnitsInByte = 8 * ByteRows::kUnitsInBit;
    QVector<Entry> entries;
    qint64 units = 0;
    qint64 told = 0;
    const QVector<ByteRows::Row>& rows = mRows->all();
    for (int i = 0; i < rows.size(); ++i) {
        const ByteRows::Row& row = rows.at(i);
        units += row.units;
        // What is rounded away here is there for the next one, so that the sum stays.
        const qint64 rounded = (units + kUnitsInByte / 2) / kUnitsInByte;
        entries.append({row.part, mRows->pathOf(i), {row.entries, row.before, rounded - told}});
        told = rounded;
    }
    return entries;
}

}  // namespace Kdd
