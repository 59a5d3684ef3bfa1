#include "server/dimse/PeerConnection.h"

#include <QtEndian>

#include <netinet/in.h>
#include <netinet/tcp.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

namespace Kdd::Dimse
{
namespace
{

constexpr int kHead = 6;  // of a PDU
constexpr unsigned char kRequest = 1;

/// Of a request for an association [bytes]; the largest that makes sense, with all classes in all forms, takes a tenth.
constexpr quint32 kLongestRequest = 512 * 1024;

/// Less than this for the length of a message is no sender but somebody who holds a place [bytes/s].
constexpr qint64 kLeastRate = 1024;

// Who ends an association, and why.
constexpr unsigned char kByProvider = 2;
constexpr unsigned char kUnknownPdu = 1;
constexpr unsigned char kInvalidValue = 6;

int millisecondsTo(PeerConnection::Clock::time_point end)
{
    const auto left =
        std::chrono::ceil<std::chrono::milliseconds>(end - PeerConnection::Clock::now()).count();
    return static_cast<int>(std::clamp<qint64>(left, 0, 3'600'000));
}

}  // namespace

PeerConnection::PeerConnection(int socket, std::unique_ptr<Http::Transport> transport, int stop,
                               std::chrono::seconds patience, const PduLimits& limits)
    : mSocket(socket)
    , mStop(stop)
    , mPatience(patience)
    , mTransport(std::move(transport))
    , mGuard(limits)
{
}

PeerConnection::~PeerConnection()
{
    close();
    ::close(mSocket);
}

PeerConnection::Clock::time_point PeerConnection::end() const
{
    return mBegun + mPatience + std::chrono::seconds(mBytes / kLeastRate);
}

void PeerConnection::beginMessage()
{
    mBegun = Clock::now();
    mBytes = 0;
}

bool PeerConnection::wait(short events, Clock::time_point end) const
{
    // Many senders write the head of a message by itself, and the rest when that was acknowledged: what would wait for an
    // answer to go with costs 40 ms for each message. It has to be said again each time.
    const int yes = 1;
    if (events == POLLIN)
        ::setsockopt(mSocket, IPPROTO_TCP, TCP_QUICKACK, &yes, sizeof yes);
    pollfd socket = {mSocket, events, 0};
    int ready = -1;
    do {
        ready = ::poll(&socket, 1, millisecondsTo(end));
    } while (ready < 0 && errno == EINTR);
    return ready > 0 && !mIsBroken;
}

PeerConnection::Came PeerConnection::await(std::chrono::milliseconds time)
{
    if (mTransport->hasUnread())
        return Came::Something;
    pollfd both[] = {{mSocket, POLLIN, 0}, {mStop, POLLIN, 0}};
    const Clock::time_point until = Clock::now() + time;
    int ready = -1;
    do {
        ready = ::poll(both, 2, millisecondsTo(until));
    } while (ready < 0 && errno == EINTR);
    if (ready <= 0)
        return Came::Nothing;
    return both[1].revents != 0 ? Came::Stop : Came::Something;
}

bool PeerConnection::isStopping() const
{
    pollfd stop = {mStop, POLLIN, 0};
    return ::poll(&stop, 1, 0) > 0;
}

bool PeerConnection::receive(QByteArray& bytes, int size)
{
    const int begin = bytes.size();
    bytes.resize(begin + size);
    for (int got = 0; got < size;) {
        const int count = readSome(bytes.data() + begin + got, size - got);
        if (count == 0)
            return false;
        got += count;
    }
    return true;
}

bool PeerConnection::receiveRequest()
{
    Outcome outcome = Outcome::WantsRead;
    while ((outcome = mTransport->begin()) == Outcome::WantsRead || outcome == Outcome::WantsWrite) {
        if (!wait(outcome == Outcome::WantsRead ? POLLIN : POLLOUT, end()))
            return false;
    }
    if (outcome != Outcome::Done || !receive(mRequest, kHead))
        return false;
    const quint32 size = qFromBigEndian<quint32>(mRequest.constData() + 2);
    if (mRequest.at(0) != kRequest || size > kLongestRequest) {
        sendAbort(kByProvider, kUnknownPdu);
        return false;
    }
    if (!receive(mRequest, static_cast<int>(size)))
        return false;
    if (!isWellFormedRequest(mRequest.constData() + kHead, size)) {
        sendAbort(kByProvider, kInvalidValue);
        return false;
    }
    return true;
}

/// 0: there is no more, for whatever reason.
int PeerConnection::readSome(char* to, int size)
{
    while (mIsOpen && !mIsBroken) {
        int count = 0;
        const Outcome outcome = mTransport->read(to, size, count);
        if (outcome == Outcome::Done) {
            mBytes += count;
            return count;
        }
        if (outcome == Outcome::Ended || outcome == Outcome::Failed ||
            !wait(outcome == Outcome::WantsRead ? POLLIN : POLLOUT, end()))
            return 0;
    }
    return 0;
}

qint64 PeerConnection::read(char* to, qint64 size)
{
    const int most = static_cast<int>(std::min<qint64>(size, 1 << 20));
    if (mRequestRead < mRequest.size()) {
        const int count = std::min(most, mRequest.size() - mRequestRead);
        std::memcpy(to, mRequest.constData() + mRequestRead, static_cast<std::size_t>(count));
        mRequestRead += count;
        return count;
    }
    const int count = readSome(to, most);
    if (count == 0 || mGuard.take(to, count))
        return count;
    sendAbort(kByProvider, kInvalidValue);
    close();
    return 0;
}

bool PeerConnection::write(const char* from, qint64 size)
{
    const Clock::time_point until = Clock::now() + mPatience;
    while (size > 0) {
        qint64 count = 0;
        const Outcome outcome = mIsOpen && !mIsBroken
                                    ? mTransport->write(from, size, Http::Transport::More::No, count)
                                    : Outcome::Failed;
        if (outcome == Outcome::Done) {
            from += count;
            size -= count;
        } else if (outcome == Outcome::Ended || outcome == Outcome::Failed ||
                   !wait(outcome == Outcome::WantsRead ? POLLIN : POLLOUT, until)) {
            return false;
        }
    }
    return true;
}

bool PeerConnection::hasData(std::chrono::seconds time)
{
    return mRequestRead < mRequest.size() || mTransport->hasUnread() || wait(POLLIN, Clock::now() + time);
}

void PeerConnection::sendAbort(unsigned char source, unsigned char reason)
{
    const char abort[] = {7, 0, 0, 0, 0, 4, 0, 0, static_cast<char>(source), static_cast<char>(reason)};
    write(abort, sizeof abort);
}

void PeerConnection::close()
{
    if (mIsOpen)
        mTransport->endWriting();
    mIsOpen = false;
}

void PeerConnection::breakOff()
{
    mIsBroken = true;
    ::shutdown(mSocket, SHUT_RDWR);
    mSwitch.breakOff();
}

}  // namespace Kdd::Dimse
