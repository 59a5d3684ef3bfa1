#pragma once

#include "server/dimse/BreakSwitch.h"
#include "server/dimse/PduGuard.h"
#include "server/http/Transport.h"

#include <QByteArray>

#include <dcmtk/config/osconfig.h>

#include <dcmtk/dcmdata/dcerror.h>
#include <dcmtk/dcmnet/dcmtrans.h>

#include <atomic>
#include <chrono>
#include <memory>

namespace Kdd::Dimse
{

/// The connection of one association: plain or over TLS, with an end to every wait, and without what PduGuard refuses. Used by
/// one thread at a time but for `breakOff`.
class PeerConnection
{
public:
    using Clock = std::chrono::steady_clock;

    enum class Came { Something, Nothing, Stop };

    /// Takes the socket, which does not block. `stop` is a descriptor that can be read from when the server stops.
    PeerConnection(int socket, std::unique_ptr<Http::Transport> transport, int stop,
                   std::chrono::seconds patience, const PduLimits& limits);
    ~PeerConnection();
    PeerConnection(const PeerConnection&) = delete;
    PeerConnection& operator=(const PeerConnection&) = delete;

    /// Whom the certificate names that the other side showed.
    QByteArray certificate() const { return mTransport->peerName(); }

    /// Agrees on encryption, and receives the whole request for an association. False: there is none, and what there is to
    /// say about that was said.
    bool receiveRequest();

    /// Waits for a message to begin.
    Came await(std::chrono::milliseconds time);

    /// Whether the server stops.
    bool isStopping() const;

    /// From here on the other side has the time of one message again.
    void beginMessage();

    /// Of the dataset that follows.
    void expectDataset(qint64 most) { mGuard.expectDataset(most); }

    /// Says that the association has ended, and why, in the protocol's numbers.
    void sendAbort(unsigned char source, unsigned char reason);

    /// Ends every wait from now on. On any thread.
    void breakOff();

    /// Connections that are had for the sake of this one are broken off with it.
    BreakSwitch& breakSwitch() { return mSwitch; }

    /// Up to so many bytes; 0 when there will be no more.
    qint64 read(char* to, qint64 size);

    /// All of them. False: the other side takes no more.
    bool write(const char* from, qint64 size);

    /// Whether something can be read, after `time` at the latest.
    bool hasData(std::chrono::seconds time);

    void close();

    int socket() const { return mSocket; }

private:
    using Outcome = Http::Transport::Outcome;

    bool receive(QByteArray& bytes, int size);
    int readSome(char* to, int size);
    bool wait(short events, Clock::time_point end) const;
    Clock::time_point end() const;

    const int mSocket;
    const int mStop;
    const std::chrono::seconds mPatience;
    std::unique_ptr<Http::Transport> mTransport;
    PduGuard mGuard;
    QByteArray mRequest;  // that was received and not read yet
    int mRequestRead = 0;
    Clock::time_point mBegun = Clock::now();
    qint64 mBytes = 0;  // since then
    bool mIsOpen = true;
    std::atomic<bool> mIsBroken{false};
    BreakSwitch mSwitch;
};

}  // namespace Kdd::Dimse
