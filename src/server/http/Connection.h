#pragma once

#include <chrono>
#include <functional>
#include <memory>

namespace Kdd::Http
{

class IoThread;

using Clock = std::chrono::steady_clock;

/// A socket as something to wait for, always with a deadline. All but `post` and `descriptor` on the thread of its I/O.
class Connection : public std::enable_shared_from_this<Connection>
{
public:
    enum class For { Reading, Writing };
    enum class Waited { Ready, Expired, Closed };

    /// Takes the socket over, which does not block.
    Connection(IoThread& thread, int socket);
    ~Connection();
    Connection(const Connection&) = delete;
    Connection& operator=(const Connection&) = delete;

    /// Calls `then` once, later and on the thread. One wait at a time.
    void wait(For what, Clock::time_point deadline, std::function<void(Waited)> then);

    /// A wait ends with `Closed`.
    void close();

    bool isOpen() const;
    int descriptor() const { return mDescriptor; }
    void post(std::function<void()> work);

private:
    struct Private;

    void armTimer();
    void expire();

    IoThread& mThread;
    int mDescriptor;
    std::unique_ptr<Private> d;
};

}  // namespace Kdd::Http
