#include "kddlib/net/cloud/Crc32c.h"

#include <QtEndian>

#include <array>

namespace Kdd
{
namespace
{

constexpr int kStep = 8;  // [bytes]
// Castagnoli's, with its bits reversed.
constexpr quint32 kPolynomial = 0x82F63B78;

/// Row n takes a byte that has n bytes behind it in its step, so that the eight of a step do not wait for each other.
using Tables = std::array<std::array<quint32, 256>, kStep>;

constexpr Tables makeTables()
{
    Tables tables = {};
    for (quint32 byte = 0; byte < 256; ++byte) {
        quint32 value = byte;
        for (int bit = 0; bit < 8; ++bit)
            value = (value >> 1) ^ ((value & 1) ? kPolynomial : 0);
        tables[0][byte] = value;
    }
    // Each row lets one zero byte follow what the row before stands for.
    for (std::size_t row = 1; row < tables.size(); ++row) {
        for (std::size_t byte = 0; byte < 256; ++byte) {
            const quint32 value = tables[row - 1][byte];
            tables[row][byte] = (value >> 8) ^ tables[0][value & 0xFF];
        }
    }
    return tables;
}

constexpr Tables kTables = makeTables();

quint32 afterStep(const uchar* bytes, quint32 value)
{
    // The checksum so far acts on the first four bytes of the step.
    const quint64 step = qFromLittleEndian<quint64>(bytes) ^ value;
    quint32 next = 0;
    for (std::size_t i = 0; i < kStep; ++i)
        next ^= kTables[kStep - 1 - i][(step >> (8 * i)) & 0xFF];
    return next;
}

}  // namespace

quint32 crc32c(const QByteArray& data, quint32 before)
{
    // Inverted at both ends, as the standard has it: so leading zeros count, and parts can be put together.
    quint32 value = ~before;
    const auto* bytes = reinterpret_cast<const uchar*>(data.constData());
    int left = data.size();
    for (; left >= kStep; left -= kStep, bytes += kStep)
        value = afterStep(bytes, value);
    for (; left > 0; --left, ++bytes)
        value = (value >> 8) ^ kTables[0][(value ^ *bytes) & 0xFF];
    return ~value;
}

}  // namespace Kdd
