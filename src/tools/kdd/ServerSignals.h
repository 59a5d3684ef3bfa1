#pragma once

#include <kddlib/Result.h>

#include <csignal>
#include <functional>

namespace Kdd
{

/// While it lives the signals that are meant for a server wait to be asked for, by threads that are started meanwhile too.
class ServerSignals
{
public:
    ServerSignals();
    ~ServerSignals();
    ServerSignals(const ServerSignals&) = delete;
    ServerSignals& operator=(const ServerSignals&) = delete;

    /// Returns with the first one that ends the process, at once if it came before this object; a second one ends it at once.
    /// One that asks for something to be read anew calls `renew`.
    void awaitEnd(const std::function<void()>& renew) const;

private:
    sigset_t mSignals = {};
    sigset_t mFormer = {};
    bool mIsOver = false;
};

/// At the start of what runs until it is interrupted: all modules come from the installation that it was started with. One
/// that is missing is a warning.
void loadForLongRun();

/// Has a server read its certificate anew, and tells what came of it.
void renewCertificate(bool hasCertificate, const std::function<Result()>& renew);

}  // namespace Kdd
