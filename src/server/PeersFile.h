#pragma once

#include "server/dimse/DimseSettings.h"

#include <QString>

#include <kddlib/Result.h>

namespace Kdd
{

/// Who may have associations, for what, and how they are spoken.
struct PeersFile
{
    Dimse::AssociationRules rules;  ///< without the server's own titles
    std::optional<Dimse::TlsRules> tls;
    QByteArray audit;  ///< file of the audit trail, "log": the log; empty: there is none

    /// Reads a peers file (JSON). Failure, with the name of what is wrong in it: a slip must not open a door.
    static Result read(const QString& path, PeersFile& file);
    static Result parse(const QByteArray& text, PeersFile& file);
};

}  // namespace Kdd
