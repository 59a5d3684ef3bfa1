#pragma once

#include "tools/kdd/ServeRequest.h"

namespace Kdd
{

/// Each runs until a signal ends it.
Outcome runServe(const GlobalOptions& options, const ServeRequest& request);
Outcome runReceive(const GlobalOptions& options, const DimseRequest& request);

}  // namespace Kdd
