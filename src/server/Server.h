#pragma once

#include "server/http/HttpSettings.h"

#include <kddlib/Result.h>

#include <memory>

namespace Kdd
{

struct ServerSettings
{
    Http::HttpSettings http;
    QByteArray prefix = "/dicom-web";  ///< of the paths of DICOMweb
};

/// What `kdd serve` runs: DICOMweb over the archive that the process's settings name. Used by one thread.
class Server
{
public:
    explicit Server(const ServerSettings& settings);

    /// Stops.
    ~Server();

    /// On failure nothing has begun.
    Result start();

    /// Returns when the requests in flight are answered, or their time is over.
    void stop();

    /// "http://127.0.0.1:8042"
    QByteArray address() const;

private:
    struct Private;
    std::unique_ptr<Private> d;
};

}  // namespace Kdd
