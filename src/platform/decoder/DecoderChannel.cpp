#include "platform/decoder/DecoderChannel.h"

#include <poll.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <limits>

namespace Kdd
{
namespace
{

/// What each message begins with.
struct MessageStart
{
    quint32 word;
    quint32 head;  ///< [bytes]
    qint64 data;   ///< [bytes]
};

}  // namespace

DecoderChannel::Outcome DecoderChannel::send(const DecoderMessage& message) const
{
    const MessageStart start = {static_cast<quint32>(message.word), static_cast<quint32>(message.head.size()),
                                message.data.size()};
    Outcome outcome = write(&start, sizeof start);
    if (outcome == Outcome::Done)
        outcome = write(message.head.constData(), message.head.size());
    if (outcome == Outcome::Done)
        outcome = write(message.data.constData(), message.data.size());
    return outcome;
}

DecoderChannel::Outcome DecoderChannel::receive(qint64 mostData, DecoderMessage& message) const
{
    MessageStart start = {};
    Outcome outcome = read(&start, sizeof start);
    if (outcome != Outcome::Done)
        return outcome;
    const qint64 most = std::min<qint64>(mostData, std::numeric_limits<int>::max() / 2);
    if (start.head > kMaxHead || start.data < 0 || start.data > most)
        return Outcome::Nonsense;
    message.word = static_cast<DecoderWord>(start.word);
    message.head = QByteArray(static_cast<int>(start.head), Qt::Uninitialized);
    message.data = QByteArray(static_cast<int>(start.data), Qt::Uninitialized);
    outcome = read(message.head.data(), message.head.size());
    return outcome == Outcome::Done ? read(message.data.data(), message.data.size()) : outcome;
}

/// A decoder waits in its calls, since it may make no others.
int DecoderChannel::flags() const
{
    return MSG_NOSIGNAL | (mDeadline ? MSG_DONTWAIT : 0);
}

DecoderChannel::Outcome DecoderChannel::await(short event) const
{
    for (;;) {
        const auto left = std::chrono::ceil<std::chrono::milliseconds>(*mDeadline - Clock::now()).count();
        if (left <= 0)
            return Outcome::Late;
        pollfd one = {mSocket, event, 0};
        const int most = std::numeric_limits<int>::max();
        if (::poll(&one, 1, static_cast<int>(std::min<std::int64_t>(left, most))) > 0)
            return Outcome::Done;
    }
}

DecoderChannel::Outcome DecoderChannel::write(const void* bytes, qint64 size) const
{
    const char* from = static_cast<const char*>(bytes);
    while (size > 0) {
        const ssize_t done = ::send(mSocket, from, static_cast<std::size_t>(size), flags());
        if (done > 0) {
            from += done;
            size -= done;
        } else if (errno == EAGAIN) {
            if (const Outcome outcome = await(POLLOUT); outcome != Outcome::Done)
                return outcome;
        } else if (errno != EINTR) {
            return Outcome::Ended;
        }
    }
    return Outcome::Done;
}

DecoderChannel::Outcome DecoderChannel::read(void* bytes, qint64 size) const
{
    char* to = static_cast<char*>(bytes);
    while (size > 0) {
        const ssize_t done = ::recv(mSocket, to, static_cast<std::size_t>(size), flags());
        if (done > 0) {
            to += done;
            size -= done;
        } else if (done == 0) {
            return Outcome::Ended;
        } else if (errno == EAGAIN) {
            if (const Outcome outcome = await(POLLIN); outcome != Outcome::Done)
                return outcome;
        } else if (errno != EINTR) {
            return Outcome::Ended;
        }
    }
    return Outcome::Done;
}

qint64 askForBytes(const DecoderChannel& channel, qint64 offset, char* out, qint64 length)
{
    using Outcome = DecoderChannel::Outcome;
    DecoderMessage wanted;
    wanted.word = DecoderWord::Wanted;
    wanted.head = bytesOf(WantedBytes{offset, std::min(length, kMaxWanted)});
    DecoderMessage bytes;
    const bool isTold = channel.send(wanted) == Outcome::Done &&
                        channel.receive(kMaxWanted, bytes) == Outcome::Done &&
                        bytes.word == DecoderWord::Bytes && bytes.data.size() <= length;
    // Who does not answer any more is not there any more; the end of the job shows that too.
    if (!isTold)
        return 0;
    std::memcpy(out, bytes.data.constData(), static_cast<std::size_t>(bytes.data.size()));
    return bytes.data.size();
}

}  // namespace Kdd
