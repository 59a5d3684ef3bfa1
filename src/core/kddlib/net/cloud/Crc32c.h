#pragma once

#include <QByteArray>

namespace Kdd
{

/// The checksum CRC-32C (Castagnoli) of `data` that follows bytes whose checksum is `before`; 0 for none before.
quint32 crc32c(const QByteArray& data, quint32 before = 0);

}  // namespace Kdd
