#pragma once

#include "server/access/AccessRules.h"
#include "server/access/AddressGuard.h"
#include "server/dicomweb/change/ChangeRules.h"
#include "server/dicomweb/store/StoreBody.h"
#include "server/dimse/DimseSettings.h"
#include "server/http/HttpSettings.h"

#include <QString>

#include <kddlib/BackgroundCheck.h>
#include <kddlib/Result.h>

#include <memory>
#include <optional>

namespace Kdd
{

struct ServerSettings
{
    Http::HttpSettings http;
    std::optional<Http::ListenAddress> status;  ///< of a listener for those who watch the server
    Access::AddressRules addresses;
    std::optional<Access::AccessRules>
        access;  ///< without them everybody may do everything, and only this machine reaches the server
    QByteArray prefix = "/dicom-web";    ///< of the paths of DICOMweb
    QString viewer;                      ///< folder of a viewer's files, served under /viewer; empty: none
    std::optional<ObjectRules> objects;  ///< that are taken; without it none are
    bool takesByRequest = true;          ///< objects, where any are taken
    std::optional<Dimse::DimseSettings> dimse;  ///< without it there are no associations
    bool isDimseDecided =
        false;              ///< that somebody decided who may have associations; else only this machine may
    QByteArray dimseAudit;  ///< as DimseLog has it
    DicomWeb::StoreLimits store;
    DicomWeb::ChangeRules changes;
    bool provesTagFiles = false;                 ///< against the image database, each time one is read
    std::optional<BackgroundCheck::Pace> check;  ///< of all bytes of the archive; without it there is none
    std::chrono::milliseconds slow{2000};        ///< requests that take longer are told in the log
};

/// What `kdd serve` runs: DICOMweb over the archive that the process's settings name. Used by one thread.
class Server
{
public:
    /// Null, with the reason in `result`, when the settings cannot be followed. Where nobody has decided who may what, that
    /// includes every address that other machines reach.
    static std::unique_ptr<Server> make(ServerSettings settings, Result& result);

    /// Stops.
    ~Server();

    /// On failure nothing has begun.
    Result start();

    /// Has connections from here on meet the certificate and key that the files hold now. On failure the former ones stay.
    Result renewCertificate();

    /// Whether there is a certificate to renew.
    bool hasCertificate() const;

    /// Returns when the requests in flight are answered, or their time is over.
    void stop();

    /// "http://127.0.0.1:8042"
    QByteArray address() const;

    /// Empty when there is no such listener.
    QByteArray statusAddress() const;

    /// "127.0.0.1:11112", empty when there is none: where associations are waited for.
    QByteArray dimseAddress() const;

private:
    struct Private;

    explicit Server(std::unique_ptr<Private> made);

    std::unique_ptr<Private> d;
};

}  // namespace Kdd
