#pragma once

#include "server/http/ListenAddress.h"

#include <kddlib/Result.h>

#include <functional>
#include <memory>

namespace Kdd::Http
{

class IoThread;

/// Takes connections at one address.
class Listener
{
public:
    /// Called on the thread with a socket that does not block, which is the caller's from then on, and the other side's
    /// address.
    using Accepted = std::function<void(int socket, const QByteArray& peer)>;

    Listener(IoThread& thread, Accepted accepted);
    ~Listener();

    /// Begins to listen; connections are taken from now on, as soon as the thread runs. The port that 0 stands for is
    /// filled in.
    Result open(ListenAddress& address);

    /// On the thread, or when it does not run.
    void close();

private:
    struct Private;

    void waitForNext();
    void accept();

    std::unique_ptr<Private> d;
};

}  // namespace Kdd::Http
