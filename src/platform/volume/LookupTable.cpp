#include "platform/volume/LookupTable.h"

#include "platform/volume/PixelTypes.h"

#include <dcmtk/dcmdata/dcelem.h>
#include <dcmtk/dcmdata/dcitem.h>

#include <algorithm>
#include <cmath>
#include <cstring>

namespace Kdd
{

namespace
{

// Told as 0, since the descriptor's sixteen bits do not reach it.
constexpr int kMaxEntries = 65536;

/// A value of any of the representations that tables come in, in the machine's order; empty when it is absent. Read
/// piece by piece, so that the dataset does not keep what was in its file.
QByteArray bytesOf(DcmItem& item, const DcmTagKey& key)
{
    DcmElement* element = nullptr;
    if (item.findAndGetElement(key, element).bad() || element->isLeaf() == OFFalse)
        return {};
    // No more than the longest table has.
    const Uint32 length = qMin<Uint32>(element->getLengthField(), 2 * kMaxEntries);
    QByteArray bytes(static_cast<int>(length), Qt::Uninitialized);
    return length > 0 && element->getPartialValue(bytes.data(), 0, length).good() ? bytes : QByteArray();
}

}  // namespace

Result readLookupTable(DcmItem& item, const DcmTagKey& descriptor, const DcmTagKey& data, bool isSigned,
                       LookupTable& table)
{
    quint16 numbers[3] = {};
    const QByteArray description = bytesOf(item, descriptor);
    if (description.size() != int(sizeof numbers))
        return Result::failure(QStringLiteral("A look-up table has no descriptor"));
    std::memcpy(numbers, description.constData(), sizeof numbers);
    const int count = numbers[0] == 0 ? kMaxEntries : numbers[0];
    const QByteArray bytes = bytesOf(item, data);
    if (bytes.size() < count)
        return Result::failure(
            QStringLiteral("A look-up table of %1 entries has %2 bytes").arg(count).arg(bytes.size()));

    table.first = isSigned ? qint16(numbers[1]) : numbers[1];
    table.entries.resize(count);
    // Entries of eight bits may be packed, two to a word; the number of bytes tells.
    if (bytes.size() >= 2 * count)
        std::memcpy(table.entries.data(), bytes.constData(), size_t(count) * 2);
    else
        std::copy_n(reinterpret_cast<const quint8*>(bytes.constData()), count, table.entries.begin());
    return Result();
}

ValueRange LookupTable::range() const
{
    const auto [least, most] = std::minmax_element(entries.cbegin(), entries.cend());
    return {double(*least), double(*most)};
}

TypedData2D LookupTable::appliedTo(const TypedData2D& pixels, double factor, double offset) const
{
    TypedData2D mapped{pixels.width, pixels.height, pixels.components, PrimitiveType::UInt16, {}};
    allocatePixels(mapped);
    const double last = double(first) + entries.size() - 1;
    visitPixelType(pixels.type, [&](auto zero) {
        const auto* values = valuesOf<decltype(zero)>(pixels);
        std::transform(values, values + numValues(pixels), valuesOf<quint16>(mapped), [&](auto value) {
            const double looked = factor * double(value) + offset;
            // Bounded while it is a real number, because a whole one may not hold it. What is no number gets
            // the first entry.
            return std::isnan(looked) ? at(first) : at(std::llround(qBound(double(first), looked, last)));
        });
    });
    return mapped;
}

}  // namespace Kdd
