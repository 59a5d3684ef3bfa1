#include "kddlib/items/RealText.h"

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcjson.h>
#include <dcmtk/ofstd/ofstd.h>

#include <algorithm>
#include <charconv>
#include <cmath>
#include <limits>

namespace Kdd
{

void appendReal(QByteArray& out, double value)
{
    // Where a number is written with an exponent, as everywhere else in texts of DICOM.
    constexpr double kLeastFixed = 1e-4;
    constexpr double kMostFixed = 1e17;
    const double size = std::fabs(value);
    const bool isFixed = size == 0 || (size >= kLeastFixed && size < kMostFixed);
    char digits[32];
    char* end = std::to_chars(digits, digits + sizeof digits, value,
                              isFixed ? std::chars_format::fixed : std::chars_format::scientific)
                    .ptr;
    end = std::remove(digits, end, '+');
    out.append(digits, static_cast<int>(end - digits));
}

void appendReal(QByteArray& out, float value)
{
    char digits[64];
    OFStandard::ftoa(digits, sizeof digits, static_cast<double>(value), 0, 0,
                     std::numeric_limits<float>::max_digits10);
    OFString number(digits);
    DcmJsonFormat::normalizeDecimalString(number);
    out.append(number.c_str());
}

}  // namespace Kdd
