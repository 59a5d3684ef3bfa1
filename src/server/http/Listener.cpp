#include "server/http/Listener.h"

#include "server/http/IoThread.h"

#include <arpa/inet.h>
#include <boost/asio/io_context.hpp>
#include <boost/asio/posix/stream_descriptor.hpp>
#include <boost/asio/steady_timer.hpp>
#include <kddlib/LogFile.h>
#include <kddlib/SystemResult.h>
#include <netinet/tcp.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

namespace Kdd::Http
{
namespace
{

namespace asio = boost::asio;
using Fault = boost::system::error_code;

/// Connections that wait to be taken while the thread is busy; the system has a bound of its own.
constexpr int kBacklog = 4096;

/// So many are taken before other sockets have their turn.
constexpr int kAtOnce = 64;

/// Without descriptors nothing can be taken, and the socket would tell so for ever.
constexpr auto kPauseWithoutDescriptors = std::chrono::milliseconds(100);

struct Address
{
    sockaddr_storage bytes = {};
    socklen_t size = sizeof bytes;

    sockaddr* any() { return reinterpret_cast<sockaddr*>(&bytes); }
    sockaddr_in& four() { return reinterpret_cast<sockaddr_in&>(bytes); }
    sockaddr_in6& six() { return reinterpret_cast<sockaddr_in6&>(bytes); }
};

Address systemAddress(const ListenAddress& address)
{
    Address made;
    if (address.isIPv6()) {
        made.size = sizeof(sockaddr_in6);
        made.six().sin6_family = AF_INET6;
        made.six().sin6_port = htons(address.port);
        ::inet_pton(AF_INET6, address.host.constData(), &made.six().sin6_addr);
    } else {
        made.size = sizeof(sockaddr_in);
        made.four().sin_family = AF_INET;
        made.four().sin_port = htons(address.port);
        ::inet_pton(AF_INET, address.host.constData(), &made.four().sin_addr);
    }
    return made;
}

quint16 portOf(Address& address)
{
    return ntohs(address.bytes.ss_family == AF_INET6 ? address.six().sin6_port : address.four().sin_port);
}

QByteArray hostOf(Address& address)
{
    char text[INET6_ADDRSTRLEN] = "";
    if (address.bytes.ss_family == AF_INET6)
        ::inet_ntop(AF_INET6, &address.six().sin6_addr, text, sizeof text);
    else
        ::inet_ntop(AF_INET, &address.four().sin_addr, text, sizeof text);
    return text;
}

}  // namespace

struct Listener::Private
{
    Private(asio::io_context& context, Accepted handler)
        : socket(context)
        , timer(context)
        , accepted(std::move(handler))
    {
    }

    asio::posix::stream_descriptor socket;
    asio::steady_timer timer;
    Accepted accepted;
};

Listener::Listener(IoThread& thread, Accepted accepted)
    : d(std::make_unique<Private>(thread.context(), std::move(accepted)))
{
}

Listener::~Listener() = default;

Result Listener::open(ListenAddress& address)
{
    Address wanted = systemAddress(address);
    const int socket = ::socket(wanted.bytes.ss_family, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    const int yes = 1;
    // A server that is started again need not wait for what is left of its former connections.
    if (socket < 0 || ::setsockopt(socket, SOL_SOCKET, SO_REUSEADDR, &yes, sizeof yes) != 0 ||
        ::bind(socket, wanted.any(), wanted.size) != 0 || ::listen(socket, kBacklog) != 0 ||
        ::getsockname(socket, wanted.any(), &wanted.size) != 0) {
        const Result fault = Result(SystemResult::of(errno)).within(QString::fromUtf8(address.text()));
        if (socket >= 0)
            ::close(socket);
        return fault;
    }
    address.port = portOf(wanted);
    d->socket.assign(socket);
    waitForNext();
    return {};
}

void Listener::waitForNext()
{
    d->socket.async_wait(asio::posix::descriptor_base::wait_read, [this](const Fault& fault) {
        if (!fault)
            accept();
    });
}

void Listener::accept()
{
    for (int i = 0; i < kAtOnce; ++i) {
        Address peer;
        const int socket =
            ::accept4(d->socket.native_handle(), peer.any(), &peer.size, SOCK_CLOEXEC | SOCK_NONBLOCK);
        if (socket >= 0) {
            const int yes = 1;
            // Answers are handed over in large pieces; the last one must not wait for an acknowledgement.
            ::setsockopt(socket, IPPROTO_TCP, TCP_NODELAY, &yes, sizeof yes);
            d->accepted(socket, hostOf(peer));
            continue;
        }
        if (errno != EMFILE && errno != ENFILE && errno != ENOBUFS && errno != ENOMEM)
            break;  // nobody waits, or who waited has gone
        LogFile::warnf("No connection can be taken: %s", std::strerror(errno));
        d->timer.expires_after(kPauseWithoutDescriptors);
        d->timer.async_wait([this](const Fault& fault) {
            if (!fault)
                waitForNext();
        });
        return;
    }
    waitForNext();
}

void Listener::close()
{
    Fault ignored;
    d->socket.close(ignored);
    d->timer.cancel(ignored);
}

}  // namespace Kdd::Http
