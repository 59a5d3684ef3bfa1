#include "server/http/Connection.h"

#include "server/http/IoThread.h"

#include <boost/asio/io_context.hpp>
#include <boost/asio/posix/stream_descriptor.hpp>
#include <boost/asio/steady_timer.hpp>

namespace Kdd::Http
{

namespace asio = boost::asio;
using Fault = boost::system::error_code;

struct Connection::Private
{
    explicit Private(asio::io_context& context, int descriptor)
        : socket(context, descriptor)
        , timer(context)
    {
    }

    asio::posix::stream_descriptor socket;
    asio::steady_timer timer;
    Clock::time_point deadline;
    Clock::time_point timerEnds;
    bool timerRuns = false;
    bool waits = false;
    bool isExpired = false;
};

Connection::Connection(IoThread& thread, int socket)
    : mThread(thread)
    , mDescriptor(socket)
    , d(std::make_unique<Private>(thread.context(), socket))
{
}

Connection::~Connection() = default;

void Connection::wait(For what, Clock::time_point deadline, std::function<void(Waited)> then)
{
    d->deadline = deadline;
    d->waits = true;
    d->isExpired = false;
    armTimer();
    const auto type = what == For::Reading ? asio::posix::descriptor_base::wait_read
                                           : asio::posix::descriptor_base::wait_write;
    d->socket.async_wait(type, [self = shared_from_this(), then = std::move(then)](const Fault& fault) {
        self->d->waits = false;
        then(!fault ? Waited::Ready : self->d->isExpired ? Waited::Expired : Waited::Closed);
    });
}

/// A timer that runs out too early is set again then: most deadlines are moved on long before they come, and a running
/// timer costs nothing.
void Connection::armTimer()
{
    if (d->timerRuns && d->timerEnds <= d->deadline)
        return;
    d->timerRuns = true;
    d->timerEnds = d->deadline;
    d->timer.expires_at(d->deadline);
    d->timer.async_wait([weak = weak_from_this()](const Fault& fault) {
        const std::shared_ptr<Connection> self = weak.lock();
        if (!fault && self != nullptr)
            self->expire();
    });
}

void Connection::expire()
{
    d->timerRuns = false;
    if (!d->waits)
        return;
    if (Clock::now() < d->deadline) {
        armTimer();
        return;
    }
    d->isExpired = true;
    d->socket.cancel();
}

void Connection::close()
{
    Fault ignored;
    d->socket.close(ignored);
    d->timer.cancel(ignored);
}

bool Connection::isOpen() const
{
    return d->socket.is_open();
}

void Connection::post(std::function<void()> work)
{
    mThread.post(std::move(work));
}

}  // namespace Kdd::Http
