#pragma once

#include "server/dimse/DimseSettings.h"
#include "tools/kdd/Commands.h"

#include <kddlib/ObjectStore.h>

namespace Kdd
{

/// What the command line says of associations; what is empty is left to the site's settings.
struct DimseRequest
{
    QByteArray listen;
    QByteArray title;
    QString peers;

    /// Declares `--dicom`, `--title` and `--peers`.
    void addTo(ArgumentList& arguments);

    /// All but where to listen.
    void addRulesTo(ArgumentList& arguments);
};

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
