// A link that takes its time: passes TCP connections on to another port of this machine and delays every byte, in both
// directions, by half the round trip given. For measuring transfers as over a distance where the kernel offers no
// means for that.
//
//     delay_proxy LISTEN-PORT TARGET-PORT ROUND-TRIP-MS [WINDOW-BYTES]
//
// At most WINDOW-BYTES of a connection are on the way in one direction, as on a link with windows (default 4 MiB).

#include <arpa/inet.h>
#include <netinet/tcp.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <condition_variable>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <deque>
#include <mutex>
#include <thread>
#include <vector>

namespace
{

using Clock = std::chrono::steady_clock;

sockaddr_in local(int port)
{
    sockaddr_in address = {};
    address.sin_family = AF_INET;
    address.sin_port = htons(static_cast<uint16_t>(port));
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    return address;
}

/// One direction of a connection.
class Lane
{
public:
    Lane(int from, int to, Clock::duration delay, std::size_t window)
        : mFrom(from)
        , mTo(to)
        , mDelay(delay)
        , mWindow(window)
    {
    }

    void receive()
    {
        bool open = true;
        while (open) {
            Block block{std::vector<char>(64 * 1024), {}};
            const ssize_t count = ::recv(mFrom, block.bytes.data(), block.bytes.size(), 0);
            open = count > 0;
            block.bytes.resize(open ? static_cast<std::size_t>(count) : 0);  // an empty one is the end
            block.due = Clock::now() + mDelay;
            std::unique_lock lock(mMutex);
            mChanged.wait(lock, [this] { return mOnTheWay < mWindow; });
            mOnTheWay += block.bytes.size();
            mBlocks.push_back(std::move(block));
            mChanged.notify_all();
        }
    }

    void send()
    {
        while (true) {
            std::unique_lock lock(mMutex);
            mChanged.wait(lock, [this] { return !mBlocks.empty(); });
            Block block = std::move(mBlocks.front());
            mBlocks.pop_front();
            lock.unlock();
            std::this_thread::sleep_until(block.due);
            const auto size = static_cast<ssize_t>(block.bytes.size());
            if (size == 0 || ::send(mTo, block.bytes.data(), block.bytes.size(), MSG_NOSIGNAL) != size)
                break;
            lock.lock();
            mOnTheWay -= block.bytes.size();
            mChanged.notify_all();
        }
        ::shutdown(mTo, SHUT_WR);
        ::shutdown(mFrom, SHUT_RD);
        const std::lock_guard lock(mMutex);
        mOnTheWay = 0;
        mChanged.notify_all();
    }

private:
    struct Block
    {
        std::vector<char> bytes;
        Clock::time_point due;
    };

    int mFrom;
    int mTo;
    Clock::duration mDelay;
    std::size_t mWindow;
    std::mutex mMutex;
    std::condition_variable mChanged;
    std::deque<Block> mBlocks;
    std::size_t mOnTheWay = 0;  // [bytes]
};

void serve(int client, int targetPort, Clock::duration delay, std::size_t window)
{
    const int server = ::socket(AF_INET, SOCK_STREAM, 0);
    const sockaddr_in target = local(targetPort);
    const int on = 1;
    ::setsockopt(client, IPPROTO_TCP, TCP_NODELAY, &on, sizeof on);
    ::setsockopt(server, IPPROTO_TCP, TCP_NODELAY, &on, sizeof on);
    if (::connect(server, reinterpret_cast<const sockaddr*>(&target), sizeof target) == 0) {
        Lane up(client, server, delay, window);
        Lane down(server, client, delay, window);
        std::thread threads[] = {std::thread([&] { up.receive(); }), std::thread([&] { up.send(); }),
                                 std::thread([&] { down.receive(); }), std::thread([&] { down.send(); })};
        for (std::thread& thread : threads)
            thread.join();
    }
    ::close(server);
    ::close(client);
}

}  // namespace

int main(int argc, char** argv)
{
    if (argc < 4) {
        std::fprintf(stderr, "usage: delay_proxy LISTEN-PORT TARGET-PORT ROUND-TRIP-MS [WINDOW-BYTES]\n");
        return 2;
    }
    const int listener = ::socket(AF_INET, SOCK_STREAM, 0);
    const sockaddr_in address = local(std::atoi(argv[1]));
    const int on = 1;
    ::setsockopt(listener, SOL_SOCKET, SO_REUSEADDR, &on, sizeof on);
    if (::bind(listener, reinterpret_cast<const sockaddr*>(&address), sizeof address) ||
        ::listen(listener, 64)) {
        std::perror("delay_proxy");
        return 1;
    }
    const Clock::duration delay = std::chrono::microseconds(std::atoi(argv[3]) * 500);
    const std::size_t window = argc > 4 ? std::strtoul(argv[4], nullptr, 10) : 4u << 20;
    for (int client = 0; (client = ::accept(listener, nullptr, nullptr)) >= 0;)
        std::thread(serve, client, std::atoi(argv[2]), delay, window).detach();
    return 0;
}
