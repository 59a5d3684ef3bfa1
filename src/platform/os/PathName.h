#pragma once

#include "platform/base/Export.h"

#include <QByteArray>
#include <QString>

namespace Kdd
{

// The name of a file is bytes to the system and text to Qt. Bytes that are no text in the encoding of the locale would
// come back from Qt as others, and so lead to another file. These functions keep every name: where the locale's
// encoding does not, bytes from 80 to FF become the characters U+DC80 to U+DCFF, which no text contains alone.

KDD_EXPORT QString pathText(const QByteArray& bytes);

/// For all that is handed to the system; `QFile` itself and its like do not know such texts.
KDD_EXPORT QByteArray pathBytes(const QString& path);

/// Whether Qt's own classes find the file of that name too.
KDD_EXPORT bool isPlainText(const QByteArray& bytes);

/// Makes a folder with all above it. False when it is not there afterwards.
KDD_EXPORT bool makeFolder(const QString& path);

}  // namespace Kdd
