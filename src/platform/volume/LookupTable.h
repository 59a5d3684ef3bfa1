#pragma once

#include "platform/base/Result.h"
#include "platform/volume/ValueRange.h"

#include <QVector>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>

class DcmItem;

namespace Kdd
{

/// A table of DICOM: stored values from `first` on are replaced, values outside by the nearest entry.
struct LookupTable
{
    int first = 0;
    QVector<quint16> entries;

    bool isEmpty() const { return entries.isEmpty(); }
    quint16 at(qint64 value) const
    {
        return entries.at(static_cast<int>(qBound<qint64>(0, value - first, entries.size() - 1)));
    }

    /// Of the entries; the table must not be empty.
    ValueRange range() const;

    /// The table's entry for factor * value + offset of each number.
    TypedData2D appliedTo(const TypedData2D& pixels, double factor = 1, double offset = 0) const;
};

/// Failure: the descriptor or the data are absent, or there are fewer entries than the descriptor says. `isSigned`:
/// the values that are looked up, and with them the first one, are signed.
Result readLookupTable(DcmItem& item, const DcmTagKey& descriptor, const DcmTagKey& data, bool isSigned,
                       LookupTable& table);

}  // namespace Kdd
