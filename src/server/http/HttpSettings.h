#pragma once

#include "server/http/ListenAddress.h"

#include <chrono>

namespace Kdd::Http
{

/// What one server may use and how long it waits. Every bound has an answer that tells the client of it.
struct HttpSettings
{
    ListenAddress address;
    QByteArray
        certificateFile;      ///< PEM, with the certificates up to the one that clients know; empty: no TLS
    QByteArray keyFile;       ///< PEM
    QByteArray clientCaFile;  ///< PEM, by which clients may show who they are; empty: they are not asked to

    int workers = 8;     ///< threads that answer
    int receivers = 16;  ///< threads that take bodies: they mostly wait for disks, and that best together
    int ioThreads = 2;   ///< threads that wait for sockets
    int connections = 10000;  ///< at a time; further ones get 503
    int requests = 256;       ///< that are answered or wait for a thread; further ones get 503

    /// A whole request has to come in this time, and each part of an answer to be taken.
    std::chrono::milliseconds patience{30000};

    /// How long a connection may rest between two requests: longer than proxies keep theirs, so that it is them who close.
    std::chrono::milliseconds idle{75000};

    /// How long requests may go on when the server stops.
    std::chrono::milliseconds stop{30000};

    unsigned headerBytes = 32 * 1024;  ///< of one request; more gets 431
    qint64 bodyBytes = 64 * 1024;      ///< of one request, read and let go; more gets 413
};

}  // namespace Kdd::Http
