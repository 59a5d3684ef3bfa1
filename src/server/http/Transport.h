#pragma once

#include "server/http/OpenFile.h"

namespace Kdd::Http
{

/// The bytes of a connection, to and fro, without ever waiting. Used by one thread at a time.
class Transport
{
public:
    enum class Outcome {
        Done,
        WantsRead,   ///< to be repeated when something has come from the other side
        WantsWrite,  ///< to be repeated when there is room for more
        Ended,       ///< the other side has said all
        Failed,
    };

    /// Whether more follows at once, for which the system may hold back a packet that is not full.
    enum class More { No, Yes };

    virtual ~Transport() = default;

    /// Agrees with the other side on how to speak; repeated until it is done.
    virtual Outcome begin() { return Outcome::Done; }

    /// At most `size` bytes; `count` says how many. `Done` means at least one.
    virtual Outcome read(char* to, int size, int& count) = 0;

    /// Whether bytes were received that no wait for the socket tells of.
    virtual bool hasUnread() const { return false; }

    /// `Done` means at least one; `count` says how many. One that wants to wait is repeated with the same bytes.
    virtual Outcome write(const char* from, qint64 size, More more, qint64& count) = 0;

    /// Whether ranges of files need not be read to be sent.
    virtual bool sendsFiles() const { return false; }

    /// Likewise, from a file. `Ended`: the file has nothing there.
    virtual Outcome sendFile(const OpenFile& file, qint64 offset, qint64 length, qint64& count);

    /// Tells the other side that nothing more comes.
    virtual void endWriting() = 0;

    virtual const char* scheme() const = 0;

    /// Whom the certificate names that the other side showed and that was found good, as RFC 2253 writes it; empty when it
    /// showed none.
    virtual QByteArray peerName() const { return {}; }
};

/// The socket itself. It stays the caller's, and open for longer than this.
class PlainTransport : public Transport
{
public:
    explicit PlainTransport(int socket)
        : mSocket(socket)
    {
    }

    Outcome read(char* to, int size, int& count) override;
    Outcome write(const char* from, qint64 size, More more, qint64& count) override;
    bool sendsFiles() const override { return true; }
    Outcome sendFile(const OpenFile& file, qint64 offset, qint64 length, qint64& count) override;
    void endWriting() override;
    const char* scheme() const override { return "http"; }

private:
    int mSocket;
};

}  // namespace Kdd::Http
