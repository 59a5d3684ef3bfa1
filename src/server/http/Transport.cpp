#include "server/http/Transport.h"

#include <sys/sendfile.h>
#include <sys/socket.h>

#include <cerrno>

namespace Kdd::Http
{
namespace
{

/// Of a call that transfers bytes. An interruption is an answer: the caller comes again.
Transport::Outcome outcomeOf(ssize_t transferred, Transport::Outcome toWaitFor)
{
    if (transferred > 0)
        return Transport::Outcome::Done;
    if (transferred == 0)
        return Transport::Outcome::Ended;
    return errno == EAGAIN || errno == EWOULDBLOCK || errno == EINTR ? toWaitFor : Transport::Outcome::Failed;
}

}  // namespace

Transport::Outcome Transport::sendFile(const OpenFile& /*file*/, qint64 /*offset*/, qint64 /*length*/,
                                       qint64& /*count*/)
{
    return Outcome::Failed;
}

Transport::Outcome PlainTransport::read(char* to, int size, int& count)
{
    const ssize_t got = ::recv(mSocket, to, static_cast<std::size_t>(size), 0);
    count = got > 0 ? static_cast<int>(got) : 0;
    return outcomeOf(got, Outcome::WantsRead);
}

Transport::Outcome PlainTransport::write(const char* from, qint64 size, More more, qint64& count)
{
    const int flags = MSG_NOSIGNAL | (more == More::Yes ? MSG_MORE : 0);
    const ssize_t sent = ::send(mSocket, from, static_cast<std::size_t>(size), flags);
    count = sent > 0 ? sent : 0;
    return outcomeOf(sent, Outcome::WantsWrite);
}

Transport::Outcome PlainTransport::sendFile(const OpenFile& file, qint64 offset, qint64 length, qint64& count)
{
    off_t from = offset;
    const ssize_t sent = ::sendfile(mSocket, file.descriptor(), &from, static_cast<std::size_t>(length));
    count = sent > 0 ? sent : 0;
    return outcomeOf(sent, Outcome::WantsWrite);
}

void PlainTransport::endWriting()
{
    ::shutdown(mSocket, SHUT_WR);
}

}  // namespace Kdd::Http
