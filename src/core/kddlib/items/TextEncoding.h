#pragma once

#include "platform/base/Export.h"

#include <QByteArray>
#include <QString>

namespace Kdd
{

/// Writes a text in the character sets that a value of Specific Character Set (0008,0005) declares, so that `decodeText`
/// gives the same text back; where none is declared, in Latin-1. Code extensions are used where the declaration has
/// them. False, with `bytes` as they were, when the declared sets lack a character or are not known.
KDD_EXPORT bool encodeText(const QString& text, const QByteArray& characterSet, QByteArray& bytes);

}  // namespace Kdd
