#pragma once

#include "platform/base/Export.h"

#include <QByteArray>

namespace Kdd
{

/// New DICOM UIDs, below the root 2.25 that anybody may use: a random UUID as a decimal number. May be used on any
/// thread.
class KDD_EXPORT CreateUIDs
{
public:
    enum Kind { Study = 0, Series = 1, Instance = 2 };

    /// At most 64 characters.
    static QByteArray createUID(Kind kind);
};

}  // namespace Kdd
