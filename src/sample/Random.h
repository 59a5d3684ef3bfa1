#pragma once

#include <QByteArray>

#include <random>

namespace Kdd
{

/// Pseudo-random numbers that belong to a name.
///
/// Every study and every image draws from a generator of its own, named after it, so that an image does not
/// change when another one is added or draws more numbers. The library's distributions are avoided: their
/// results differ from one standard library to the next.
class SampleRandom
{
public:
    explicit SampleRandom(const QByteArray& name);

    /// A whole number from `first` to `last`, both included; `first` <= `last`.
    int between(int first, int last);

    /// A number from -1 to 1, those near 0 the most frequent.
    double noise();

private:
    double fraction();  // 0 <= fraction < 1

    std::mt19937 mEngine;
};

/// The DICOM UID that belongs to a name: 2.25. and the decimal digits of the name's UUID.
QByteArray sampleUid(const QByteArray& name);

}  // namespace Kdd
