#pragma once

#include "kddlib/tagfile/ByteMap.h"

#include <QHash>
#include <QVector>

namespace Kdd
{

class KxMsg;

/// The entries of a byte map while files are added to it.
class ByteRows
{
public:
    /// Parts of a compressed byte, which a repetition may divide among many attributes.
    static constexpr qint64 kUnitsInBit = 1 << 16;

    struct Row
    {
        ByteMap::Part part;
        int parent;  // row of the sequence, or of the part
        DcmTagKey key;
        qint64 entries = 0;
        qint64 before = 0;
        qint64 units = 0;  // after compression
    };

    ByteRows();

    static int of(ByteMap::Part part) { return static_cast<int>(part); }
    int below(int parent, const DcmTagKey& key);
    Row& at(int row) { return mRows[row]; }
    const QVector<Row>& all() const { return mRows; }
    QVector<DcmTagKey> pathOf(int row) const;

private:
    QVector<Row> mRows;
    QHash<quint64, int> mBelow;
};

/// Bytes of a body, one after the other, that are spent for the same.
struct BodySpan
{
    int row;
    int bytes;
};

/// What a body is made of.
struct BodyParts
{
    QVector<BodySpan> spans;     // all of it
    QVector<bool> namedByImage;  // of each blob
};

/// Walks the records of a body, by their lengths alone, and counts them in `rows`. False when it is damaged. What
/// `readStudy` accepts may have records of which it takes no notice, so nothing is relied on.
bool walkBody(const QByteArray& body, ByteRows& rows, BodyParts& parts);

}  // namespace Kdd
