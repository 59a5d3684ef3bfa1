#pragma once

#include "platform/database/SearchSelection.h"

namespace Kxg
{

/// Leaves in the selection the studies that are within all of them.
void addLimits(SearchSelection& selection, const SqlDialect& dialect, const StudyLimits& limits);

}  // namespace Kxg
