#pragma once

#include <QByteArray>

namespace Kdd::Http
{

/// Where a server waits for connections: a numeric address of this machine, or "localhost", and a port.
struct ListenAddress
{
    QByteArray host;   ///< "127.0.0.1", "::1"
    quint16 port = 0;  ///< 0: any that is free

    /// "127.0.0.1:8042", "[::1]:8042", "localhost:8042".
    static bool parse(const QByteArray& text, ListenAddress& address);

    bool isIPv6() const { return host.contains(':'); }

    /// Whether only processes of this machine reach it.
    bool isLoopback() const;

    /// As it is parsed.
    QByteArray text() const;
};

}  // namespace Kdd::Http
