#pragma once

#include "kddlib/items/PlainSource.h"
#include "kddlib/tagmodel/VrCode.h"

#include <QByteArray>
#include <QHash>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>

namespace Kdd
{

class TagMap;

/// The bytes of a file around the place that was looked at last: most headers cost one read.
class FileWindow
{
public:
    /// The file must outlive the object.
    explicit FileWindow(PlainSource& file)
        : mFile(file)
    {
    }

    static constexpr qint64 kLongest = 64 * 1024;  // that can be had at once [bytes]

    qint64 size() const { return mFile.size(); }

    /// How much is read at once, at most `kLongest` [bytes].
    void setSpan(qint64 bytes) { mSpan = bytes; }

    /// `count` bytes from `offset` (0-based) on, valid until the next call; null when the file does not have them or
    /// they are too many.
    const char* at(qint64 offset, qint64 count)
    {
        const bool isHere = offset >= mStart && count <= mStart + mCount - offset;
        return isHere ? mBytes + (offset - mStart) : fill(offset, count);
    }

    /// The same for any number of bytes, which are the caller's; false when the file does not have them.
    bool copy(qint64 offset, qint64 count, QByteArray& bytes);

    /// False when the file was written to between two of several reads, so that their bytes need not belong together.
    bool isOfOnePiece() const { return mReads < 2 || mFile.isUnchanged(); }

private:
    const char* fill(qint64 offset, qint64 count);

    PlainSource& mFile;
    qint64 mStart = 0;
    qint64 mCount = 0;
    qint64 mSpan = 16 * 1024;
    int mReads = 0;
    char mBytes[kLongest];
};

/// The head of an element.
struct PlainHead
{
    static constexpr quint32 kUndefined = 0xffffffff;

    DcmTagKey key;
    VrCode vr = VrCode::Unknown;  ///< Unknown for items and delimiters, which have none
    int width = 1;                ///< of a number of the VR, by which the length can be divided [bytes]
    quint32 length = 0;           ///< of the value as it is written [bytes]
    qint64 value = 0;             ///< where the value begins, 0-based

    bool isOpen() const { return length == kUndefined; }
};

/// Reads heads of elements of one little-endian syntax. What is not written as usual is not taken, nor is an attribute
/// whose VR takes more than a look at the dictionary.
class PlainHeadReader
{
public:
    explicit PlainHeadReader(FileWindow& bytes)
        : mBytes(bytes)
    {
    }

    /// At first they are.
    void setVrsWritten(bool are) { mHasVrs = are; }

    /// The head at an offset; false when it is of an unusual form, or it or its value do not end at `end` or before.
    /// `item` has the elements before it, by which a private attribute and some others are known.
    bool read(qint64 at, qint64 end, const TagMap& item, PlainHead& head);

private:
    bool readVr(qint64 at, qint64 end, const char* bytes, PlainHead& head);
    bool findVr(const TagMap& item, PlainHead& head);
    int dictionaryVr(const DcmTagKey& key, const QByteArray& creator);

    FileWindow& mBytes;
    bool mHasVrs = true;
    QHash<quint32, int> mPublicVrs;                      // DCMTK's numbers
    QHash<QPair<quint32, QByteArray>, int> mPrivateVrs;  // by key and private creator
};

}  // namespace Kdd
