#pragma once

#include "platform/database/SearchSql.h"

namespace Kxg
{

/// " AND ..." for studies that are named `s` outside.
SearchSql limitsSql(const SqlDialect& dialect, const StudyLimits& limits);

}  // namespace Kxg
