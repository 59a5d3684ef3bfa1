#pragma once

#include "server/dimse/Association.h"

#include <kddlib/Result.h>

namespace Kdd::Dimse
{

/// Waits for associations at one address, and runs each on a thread of its own. `start` and `stop` are called by one thread,
/// the numbers by any.
class DimseListener
{
public:
    /// The observer outlives it. Null, with the reason, when the settings cannot be followed.
    static std::unique_ptr<DimseListener> make(const DimseSettings& settings, Providers providers,
                                               AssociationObserver& observer, Result& result);

    /// Stops.
    ~DimseListener();

    /// On failure nothing has begun.
    Result start();

    /// Takes no more associations, and returns when the messages that have begun are answered, or their time is over.
    void stop();

    /// Has connections from here on meet the certificate and key that the files hold now. On failure the former ones stay.
    Result renewCertificate();

    /// With the port that 0 stood for.
    Http::ListenAddress address() const;

    /// That are open.
    int associations() const;

private:
    struct Private;

    explicit DimseListener(std::unique_ptr<Private> made);

    std::unique_ptr<Private> d;
};

}  // namespace Kdd::Dimse
