#pragma once

#include <functional>
#include <memory>

namespace boost::asio
{
class io_context;
}

namespace Kdd::Http
{

/// One thread that waits for many sockets and does the short work in between.
class IoThread
{
public:
    IoThread();

    /// What was posted and not begun is dropped.
    ~IoThread();

    void start();

    /// Returns when the thread has ended, whatever still waits.
    void stop();

    /// To be done on the thread. May be called on any.
    void post(std::function<void()> work);

    boost::asio::io_context& context();

private:
    struct Private;
    std::unique_ptr<Private> d;
};

}  // namespace Kdd::Http
