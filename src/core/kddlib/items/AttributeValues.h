#pragma once

#include "kddlib/items/AttributeForm.h"

#include <QByteArray>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcvr.h>

namespace Kdd
{

/// Appends an attribute with all of its values. `value` is what a `TagElement` holds, but for texts, which are in UTF-8
/// here.
///
/// Each value is without the spaces that pad it. A text of nothing but empty values is no value, an incomplete number at the
/// end neither.
void appendAttribute(QByteArray& out, const AttributeForm& form, const AttributeName& name, DcmEVR vr,
                     const QByteArray& value);

}  // namespace Kdd
