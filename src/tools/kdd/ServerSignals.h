#pragma once

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

    /// Returns with the first one that ends the process; a second one ends it at once. One that asks for files to be read anew
    /// has `renew` called.
    void awaitEnd(const std::function<void()>& renew) const;

private:
    sigset_t mSignals = {};
    sigset_t mFormer = {};
};

}  // namespace Kdd
