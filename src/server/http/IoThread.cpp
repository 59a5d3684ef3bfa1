#include "server/http/IoThread.h"

#include <boost/asio/executor_work_guard.hpp>
#include <boost/asio/io_context.hpp>
#include <boost/asio/post.hpp>

#include <thread>

namespace Kdd::Http
{

struct IoThread::Private
{
    boost::asio::io_context context{1};
    boost::asio::executor_work_guard<boost::asio::io_context::executor_type> work{context.get_executor()};
    std::thread thread;
};

IoThread::IoThread()
    : d(std::make_unique<Private>())
{
}

IoThread::~IoThread()
{
    stop();
}

void IoThread::start()
{
    d->thread = std::thread([this] { d->context.run(); });
}

void IoThread::stop()
{
    d->context.stop();
    if (d->thread.joinable())
        d->thread.join();
}

void IoThread::post(std::function<void()> work)
{
    boost::asio::post(d->context, std::move(work));
}

boost::asio::io_context& IoThread::context()
{
    return d->context;
}

}  // namespace Kdd::Http
