#pragma once

#include "server/http/Transport.h"

#include <kddlib/Result.h>

#include <memory>

namespace Kdd::Http
{

/// A server's certificate and key, and how it speaks TLS: 1.2 or later. May be used on any thread.
class TlsContext
{
public:
    /// With `clientCaFile` clients may show a certificate, which has to be good by one of those there; empty: they are not
    /// asked for one. Null, with the reason and the file's name in `result`, when one of the files cannot be used or they
    /// do not belong together.
    static std::unique_ptr<TlsContext> make(const QByteArray& certificateFile, const QByteArray& keyFile,
                                            const QByteArray& clientCaFile, Result& result);
    ~TlsContext();

    /// For the server's side of a connection. The socket stays the caller's, and open for longer than what is returned.
    std::unique_ptr<Transport> accept(int socket);

private:
    struct Private;

    TlsContext();

    std::unique_ptr<Private> d;
};

}  // namespace Kdd::Http
