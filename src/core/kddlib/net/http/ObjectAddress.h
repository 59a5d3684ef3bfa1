#pragma once

#include "platform/base/Export.h"

#include <QByteArray>

namespace Kdd
{

/// Whether a name is that of an object behind a URL: it begins with "http://", "https://" or "gs://". A file's name that
/// was given without its folder may begin with the same letters, but not with the slashes.
KDD_EXPORT bool isObjectAddress(const QByteArray& name);

/// An address, or any other name, as it may stand in logs and on a screen: of a user in front of the host and of parts
/// of the query that let whoever knows them in (signatures, tokens, keys, sessions) it shows "***".
KDD_EXPORT QByteArray shownAddress(const QByteArray& name);

}  // namespace Kdd
