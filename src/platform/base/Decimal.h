#pragma once

#include <QByteArray>
#include <QVector>

namespace Kdd
{

/// The number at the head of a text: blanks, sign, digits with a point, exponent; 0 when there is none. As `strtod` in a
/// program that has chosen no locale: what separates decimals is a point on every machine, also where people write a
/// comma. A host may switch the locale at any time and for reasons of its own.
double decimalNumber(const char* text);

/// The numbers of a multi-valued DICOM text; none when one of them is no number or not finite.
QVector<double> numbersOf(const QByteArray& text);

}  // namespace Kdd
