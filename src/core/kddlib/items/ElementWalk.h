#pragma once

#include "kddlib/items/FrameIndex.h"
#include "platform/volume/KxCompressedDataMedia.h"

#include <QByteArray>
#include <QVector>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>

namespace Kdd
{

/// The bytes of a source around the place that was looked at last, so that heads of elements cost no read each.
class ByteWindow
{
public:
    explicit ByteWindow(MediaSource& source)
        : mSource(source)
    {
    }

    qint64 size() const { return mSource.size(); }

    /// How much is read at once; at first so much that most headers fit [bytes].
    void setSpan(int bytes) { mSpan = bytes; }

    /// `count` bytes from `offset` on, valid until the next call; null when the source ends before or cannot be read.
    const char* at(qint64 offset, int count);

private:
    MediaSource& mSource;
    QByteArray mBytes;
    qint64 mStart = 0;
    int mSpan = 16 * 1024;
};

/// Steps over the elements of a little-endian dataset without reading their values. Every length is held against
/// where the dataset, the sequence or the item ends.
class ElementWalk
{
public:
    ElementWalk(ByteWindow& bytes, bool isExplicit)
        : mBytes(bytes)
        , mIsExplicit(isExplicit)
    {
    }

    struct Element
    {
        DcmTagKey key;
        char vr[2] = {0, 0};     ///< zero where it is not written
        qint64 offset = 0;       ///< of its tag
        qint64 value = 0;        ///< where its value begins
        qint64 length = 0;       ///< of its value [bytes]
        bool isOpen = false;     ///< its length is not told: a delimiter ends it
        bool isExplicit = true;  ///< whether VRs are written in its items
    };

    /// The element at an offset; false when none can be understood there that ends at `end` or before.
    bool read(qint64 at, qint64 end, Element& element);

    /// Where the element ends; -1 when what it holds is damaged or nests too deep.
    qint64 endOf(const Element& element, qint64 end);

    /// Follows the steps from the elements between `at` and `end` to one of them, or of an item in them, whose length
    /// is known then. False when it is not there or the way is damaged.
    bool find(const QVector<ElementStep>& steps, qint64 at, qint64 end, Element& element);

private:
    bool read(qint64 at, qint64 end, bool isExplicit, Element& element);
    qint64 endOf(const Element& element, qint64 end, int depth);
    qint64 endOfItems(const Element& sequence, qint64 end, int depth);
    qint64 endOfItem(const Element& item, qint64 end, bool isExplicit, int depth);
    bool findHere(const DcmTagKey& key, qint64 at, qint64 end, bool isExplicit, Element& element);
    bool findItem(const Element& sequence, int index, Element& item);

    ByteWindow& mBytes;
    bool mIsExplicit;
};

}  // namespace Kdd
