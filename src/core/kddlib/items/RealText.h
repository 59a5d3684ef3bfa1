#pragma once

#include <QByteArray>

namespace Kdd
{

/// Appends the fewest digits that read back as the very number, which has to be finite. DCMTK's functions are some units off
/// in the last place below 0.1 and beyond 10^15. The exponent has no "+".
void appendReal(QByteArray& out, double value);

/// With nine digits, which read back as the very float.
void appendReal(QByteArray& out, float value);

}  // namespace Kdd
