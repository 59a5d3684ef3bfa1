#pragma once

#include "server/dimse/AssociationRules.h"
#include "server/http/ListenAddress.h"

#include <chrono>
#include <optional>

namespace Kdd::Dimse
{

/// How associations are spoken over TLS.
struct TlsRules
{
    QByteArray certificateFile;  ///< PEM
    QByteArray keyFile;          ///< PEM
    QByteArray caFile;  ///< PEM, by which certificates of callers have to be good; empty: they show none
    bool needsCertificate = false;  ///< of every caller
};

struct DimseSettings
{
    Http::ListenAddress address;
    AssociationRules rules;
    std::optional<TlsRules> tls;
    int associations = 64;  ///< at a time; further ones are rejected for the time being
    std::chrono::seconds patience{
        30};  ///< for an association request, for a message once it began, for taking answers
    std::chrono::seconds idle{300};          ///< between two messages
    std::chrono::milliseconds linger{1000};  ///< so long nothing comes from who waits to be told something
    std::chrono::milliseconds stop{30000};   ///< for messages that have begun when the server stops
};

}  // namespace Kdd::Dimse
