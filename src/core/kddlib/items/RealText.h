#pragma once

#include <QByteArray>

namespace Kdd
{

/// The fewest digits that read back as the very number, which has to be finite. DCMTK's functions are some units off in the
/// last place below 0.1 and beyond 10^15. The exponent has no "+".
QByteArray realText(double value);

}  // namespace Kdd
