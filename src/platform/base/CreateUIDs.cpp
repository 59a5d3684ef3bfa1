#include "platform/base/CreateUIDs.h"

#include <QUuid>

namespace Kdd
{
namespace
{

/// A big-endian integer of any length, in decimal without leading zeros.
QByteArray decimal(QByteArray number)
{
    QByteArray digits;
    // Division by hand: each round leaves the quotient in place and gives the next digit as the remainder.
    for (bool isZero = false; !isZero;) {
        int remainder = 0;
        isZero = true;
        for (char& byte : number) {
            const int dividend = remainder * 256 + static_cast<unsigned char>(byte);
            byte = static_cast<char>(dividend / 10);
            remainder = dividend % 10;
            isZero = isZero && byte == 0;
        }
        digits.prepend(static_cast<char>('0' + remainder));
    }
    return digits;
}

}  // namespace

QByteArray CreateUIDs::createUID(Kind /*kind*/)
{
    // A UUID says nothing of what it names, so the kinds do not differ.
    return "2.25." + decimal(QUuid::createUuid().toRfc4122());
}

}  // namespace Kdd
