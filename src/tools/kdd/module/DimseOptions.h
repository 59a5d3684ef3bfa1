#pragma once

#include "server/dimse/DimseSettings.h"
#include "tools/kdd/ServeRequest.h"

#include <kddlib/ObjectStore.h>

#include <optional>

namespace Kdd
{

/// What is wanted of associations.
struct DimseOrder
{
    std::optional<Dimse::DimseSettings> settings;  ///< without it there are none
    bool isDecided = false;                        ///< somebody decided who may have them
    QByteArray audit;                              ///< where the trail of them is written; empty: nowhere
};

/// False, with the reason logged, when something is written that is none.
bool readDimse(const DimseRequest& request, DimseOrder& order);

/// Likewise.
bool readObjectRules(const GlobalOptions& options, ObjectRules& rules);

}  // namespace Kdd
