#include "kddlib/items/RealText.h"

#include <charconv>
#include <cmath>

namespace Kdd
{

QByteArray realText(double value)
{
    // Where a number is written with an exponent, as everywhere else in texts of DICOM.
    constexpr double kLeastFixed = 1e-4;
    constexpr double kMostFixed = 1e17;
    const double size = std::fabs(value);
    const bool isFixed = size == 0 || (size >= kLeastFixed && size < kMostFixed);
    char digits[32];
    const auto written = std::to_chars(digits, digits + sizeof digits, value,
                                       isFixed ? std::chars_format::fixed : std::chars_format::scientific);
    return QByteArray(digits, static_cast<int>(written.ptr - digits)).replace("e+", "e");
}

}  // namespace Kdd
