#pragma once

#include <QByteArray>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dctagkey.h>

namespace Kdd
{

constexpr int kKeyDigits = 8;

/// Writes group and element as both forms of metadata and their addresses have them, "00100010".
inline void writeKeyDigits(char* digits, const DcmTagKey& key)
{
    const unsigned int number = (static_cast<unsigned int>(key.getGroup()) << 16) | key.getElement();
    for (int i = 0; i < kKeyDigits; ++i)
        digits[i] = "0123456789ABCDEF"[(number >> (28 - 4 * i)) & 15];
}

inline QByteArray keyDigits(const DcmTagKey& key)
{
    QByteArray digits(kKeyDigits, Qt::Uninitialized);
    writeKeyDigits(digits.data(), key);
    return digits;
}

}  // namespace Kdd
