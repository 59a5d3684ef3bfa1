#pragma once

#include "kddlib/archive/DicomInput.h"
#include "kddlib/items/PlainObjects.h"

#include <QByteArray>

namespace Kdd
{

/// Turns what was read of the object behind a URL into what `readDicomInput` makes of a file with its bytes; of one that
/// is not of the usual form more is fetched for that, of a volume file all of it. Damaged objects are refused.
DicomInput takeObject(const QByteArray& url, ObjectRead read);

}  // namespace Kdd
