#pragma once

#include "kddlib/tagmodel/VrCode.h"

#include <QByteArray>

namespace Kdd
{

/// What values of the VR are called whose form is laid down: "date", "time", "number", ...; null for other VRs.
const char* kindOfValue(VrCode vr);

/// The first of the values, separated by backslashes, that does not have the form of the VR; an empty text when all have it, are
/// empty, or the VR lays none down.
QByteArray firstOddValue(VrCode vr, const QByteArray& text);

}  // namespace Kdd
