#include "sample/Random.h"

#include <QCryptographicHash>
#include <QUuid>
#include <QtEndian>

#include <algorithm>

namespace Kdd
{

namespace
{

// The name space of all sample UIDs; with another one every UID would be another.
const QUuid kNamesOfSamples("{6f2c9c2e-58a1-4c0b-9a37-1d0e5b7c42f3}");

std::uint32_t seedOf(const QByteArray& name)
{
    // Not by std::hash, whose values differ from one library to the next.
    return qFromLittleEndian<quint32>(QCryptographicHash::hash(name, QCryptographicHash::Sha1).constData());
}

// Long division by ten; the 128-bit number shrinks in place.
char takeLastDigit(QByteArray& bigEndian)
{
    unsigned rest = 0;
    for (char& byte : bigEndian) {
        const unsigned part = rest * 256 + static_cast<unsigned char>(byte);
        byte = static_cast<char>(part / 10);
        rest = part % 10;
    }
    return static_cast<char>('0' + rest);
}

}  // namespace

SampleRandom::SampleRandom(const QByteArray& name)
    : mEngine(seedOf(name))
{
}

int SampleRandom::between(int first, int last)
{
    return first + static_cast<int>(fraction() * (last - first + 1));
}

double SampleRandom::noise()
{
    // The difference of two even distributions is a triangle around 0.
    const double one = fraction();
    return one - fraction();
}

double SampleRandom::fraction()
{
    // The engine gives 32 bits; divided by 2^32 they never reach 1.
    return static_cast<std::uint32_t>(mEngine()) / 4294967296.0;
}

QByteArray sampleUid(const QByteArray& name)
{
    QByteArray number = QUuid::createUuidV5(kNamesOfSamples, name).toRfc4122();
    QByteArray digits;
    // Until the number is used up; that of a name is never 0.
    while (number.count('\0') < number.size())
        digits.append(takeLastDigit(number));
    std::reverse(digits.begin(), digits.end());
    return "2.25." + digits;
}

}  // namespace Kdd
