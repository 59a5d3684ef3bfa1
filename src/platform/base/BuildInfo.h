#pragma once

#include "platform/base/Export.h"

namespace Kdd
{

/// What this build is, for version output and user agents. May be used on any thread.
class KDD_EXPORT BuildInfo
{
public:
    /// "kddlib 0.1.0"
    static const char* text();
};

}  // namespace Kdd
