#pragma once

#include "server/DimseService.h"

namespace Kdd
{

/// What `kdd receive` runs: associations over the archive that the process's settings name, and no HTTP. Used by one thread.
class Receiver
{
public:
    /// Objects are taken by the rules. Null, with the reason in `result`, when the settings cannot be followed.
    static std::unique_ptr<Receiver> make(const Dimse::DimseSettings& settings, const QByteArray& audit,
                                          bool isDecided, const ObjectRules& objects, Result& result);

    /// Stops.
    ~Receiver();

    /// On failure nothing has begun.
    Result start();

    /// Whether there is a certificate to renew.
    bool hasCertificate() const { return mService->hasCertificate(); }

    /// Has associations from here on meet the certificate and key that the files hold now. On failure the former ones stay.
    Result renewCertificate() { return mService->renewCertificate(); }

    /// Returns when the messages that have begun are answered, or their time is over.
    void stop();

    Http::ListenAddress address() const { return mService->address(); }

private:
    Receiver() = default;

    ServedArchive mArchive;
    std::unique_ptr<DimseService> mService;
    std::chrono::milliseconds mStopTime{0};
    bool mIsRunning = false;
};

}  // namespace Kdd
