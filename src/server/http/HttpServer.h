#pragma once

#include "server/http/Exchange.h"
#include "server/http/HttpSettings.h"
#include "server/http/Response.h"

#include <memory>

namespace Kdd::Http
{

/// Speaks HTTP/1.1 at one address and has requests answered by a handler. May be used on any thread; `start` and `stop` by
/// one.
class HttpServer
{
public:
    /// Both outlive the server. The process ignores SIGPIPE from here on: that a client went away is told by the call that
    /// sends.
    HttpServer(const HttpSettings& settings, Handler& handler, ExchangeObserver& observer);

    /// Stops.
    ~HttpServer();

    /// Answers from here on. On failure (the address is taken, the certificate cannot be read) nothing has begun.
    Result start();

    /// Reads certificate and key anew, for connections that come from here on. On failure the former ones stay. May be called
    /// on any thread, between start and stop.
    Result renewCertificate();

    /// Takes no more connections, ends those that rest, and returns when the requests in flight are answered, or their time
    /// is over.
    void stop();

    /// "http://127.0.0.1:8042", with the port that was found.
    QByteArray address() const;

    int connections() const;
    int requestsInFlight() const;

private:
    struct Private;
    std::unique_ptr<Private> d;
};

}  // namespace Kdd::Http
