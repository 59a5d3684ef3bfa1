#include "server/dimse/DimseListener.h"

#include "server/http/TlsTransport.h"

#include <arpa/inet.h>
#include <kddlib/LogFile.h>
#include <kddlib/SystemResult.h>
#include <netinet/tcp.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <condition_variable>
#include <cstring>
#include <list>
#include <mutex>
#include <thread>

namespace Kdd::Dimse
{
namespace
{

constexpr int kBacklog = 256;

/// Connections beside those of associations: whose requests have not come yet, and who will be told that there are too many.
constexpr int kAtTheDoor = 64;

/// Without descriptors nothing can be taken, and the socket would tell so for ever.
constexpr auto kPause = std::chrono::milliseconds(100);

union Address {
    sockaddr any;
    sockaddr_in four;
    sockaddr_in6 six;
};

Address systemAddress(const Http::ListenAddress& address, socklen_t& size)
{
    Address made = {};
    if (address.isIPv6()) {
        size = sizeof made.six;
        made.six.sin6_family = AF_INET6;
        made.six.sin6_port = htons(address.port);
        ::inet_pton(AF_INET6, address.host.constData(), &made.six.sin6_addr);
    } else {
        size = sizeof made.four;
        made.four.sin_family = AF_INET;
        made.four.sin_port = htons(address.port);
        ::inet_pton(AF_INET, address.host.constData(), &made.four.sin_addr);
    }
    return made;
}

QByteArray hostOf(const Address& address)
{
    char text[INET6_ADDRSTRLEN] = "";
    if (address.any.sa_family == AF_INET)
        ::inet_ntop(AF_INET, &address.four.sin_addr, text, sizeof text);
    else if (IN6_IS_ADDR_V4MAPPED(&address.six.sin6_addr))
        ::inet_ntop(AF_INET, &address.six.sin6_addr.s6_addr[12], text, sizeof text);
    else
        ::inet_ntop(AF_INET6, &address.six.sin6_addr, text, sizeof text);
    return text;
}

class Descriptor
{
public:
    Descriptor() = default;
    ~Descriptor() { reset(-1); }
    Descriptor(const Descriptor&) = delete;
    Descriptor& operator=(const Descriptor&) = delete;

    void reset(int number)
    {
        if (mNumber >= 0)
            ::close(mNumber);
        mNumber = number;
    }
    int number() const { return mNumber; }

private:
    int mNumber = -1;
};

}  // namespace

struct DimseListener::Private
{
    /// One connection with its thread.
    struct Worker
    {
        std::thread thread;
        PeerConnection* connection = nullptr;  // while it can be broken off
        bool isAssociation = false;            // and has asked to be one
        bool isDone = false;
    };

    Private(const DimseSettings& wanted, Providers made, AssociationObserver& told)
        : settings(wanted)
        , providers(std::move(made))
        , observer(told)
    {
    }

    std::shared_ptr<Http::TlsContext> readCertificate(Result& result) const;
    std::shared_ptr<Http::TlsContext> context() const { return std::atomic_load(&tls); }
    Result listen();
    void accept();
    bool acceptOne();
    void serve(std::list<Worker>::iterator worker, int socket, const QByteArray& peer);
    void associate(std::list<Worker>::iterator worker, int socket, const QByteArray& peer);
    bool isTrusted(const PeerConnection& connection, const QByteArray& peer) const;
    void answer(PeerConnection& connection, const QByteArray& peer);
    void reap();
    void breakOff(bool alsoAssociations);

    DimseSettings settings;
    const Providers providers;
    AssociationObserver& observer;
    std::unique_ptr<AssociationDoor> door;
    std::shared_ptr<Http::TlsContext> tls;  // to be had by `context`
    Descriptor socket;
    Descriptor stopped;  // can be read from when the server stops
    std::thread acceptor;
    std::atomic<int> associations{0};
    std::atomic<quint64> count{0};
    std::mutex mutex;
    std::condition_variable ended;
    std::list<Worker> workers;
};

std::unique_ptr<DimseListener> DimseListener::make(const DimseSettings& settings, Providers providers,
                                                   AssociationObserver& observer, Result& result)
{
    auto made = std::make_unique<Private>(settings, std::move(providers), observer);
    result = {};
    if (settings.tls)
        made->tls = made->readCertificate(result);
    if (result.good())
        made->door = AssociationDoor::open(result);
    if (result.bad())
        return nullptr;
    return std::unique_ptr<DimseListener>(new DimseListener(std::move(made)));
}

DimseListener::DimseListener(std::unique_ptr<Private> made)
    : d(std::move(made))
{
}

DimseListener::~DimseListener()
{
    stop();
}

std::shared_ptr<Http::TlsContext> DimseListener::Private::readCertificate(Result& result) const
{
    return Http::TlsContext::make(settings.tls->certificateFile, settings.tls->keyFile, settings.tls->caFile,
                                  result);
}

Result DimseListener::renewCertificate()
{
    Result result;
    if (!d->settings.tls)
        return result;
    const std::shared_ptr<Http::TlsContext> renewed = d->readCertificate(result);
    if (renewed != nullptr)
        std::atomic_store(&d->tls, renewed);
    return result;
}

Http::ListenAddress DimseListener::address() const
{
    return d->settings.address;
}

int DimseListener::associations() const
{
    return d->associations;
}

// ---- connections

Result DimseListener::start()
{
    const Result listening = d->listen();
    if (listening.good())
        d->acceptor = std::thread([this] { d->accept(); });
    return listening;
}

Result DimseListener::Private::listen()
{
    socklen_t size = 0;
    Address wanted = systemAddress(settings.address, size);
    const int yes = 1;
    stopped.reset(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
    socket.reset(::socket(wanted.any.sa_family, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    // A server that is started again need not wait for what is left of its former connections.
    if (stopped.number() < 0 || socket.number() < 0 ||
        ::setsockopt(socket.number(), SOL_SOCKET, SO_REUSEADDR, &yes, sizeof yes) != 0 ||
        ::bind(socket.number(), &wanted.any, size) != 0 || ::listen(socket.number(), kBacklog) != 0 ||
        ::getsockname(socket.number(), &wanted.any, &size) != 0)
        return Result(SystemResult::of(errno)).within(QString::fromUtf8(settings.address.text()));
    settings.address.port =
        ntohs(wanted.any.sa_family == AF_INET6 ? wanted.six.sin6_port : wanted.four.sin_port);
    return {};
}

void DimseListener::Private::accept()
{
    pollfd both[] = {{socket.number(), POLLIN, 0}, {stopped.number(), POLLIN, 0}};
    while (both[1].revents == 0) {
        ::poll(both, 2, -1);
        if (both[0].revents != 0 && both[1].revents == 0 && !acceptOne())
            std::this_thread::sleep_for(kPause);
        reap();
    }
    socket.reset(-1);
}

/// False: the system can give no more.
bool DimseListener::Private::acceptOne()
{
    Address peer = {};
    socklen_t size = sizeof peer;
    const int taken = ::accept4(socket.number(), &peer.any, &size, SOCK_CLOEXEC | SOCK_NONBLOCK);
    if (taken < 0) {
        const bool isFull = errno == EMFILE || errno == ENFILE || errno == ENOBUFS || errno == ENOMEM;
        if (isFull)
            LogFile::warnf("No association can be taken: %s", std::strerror(errno));
        return !isFull;
    }
    const int yes = 1;
    ::setsockopt(taken, IPPROTO_TCP, TCP_NODELAY, &yes, sizeof yes);
    const std::lock_guard<std::mutex> lock(mutex);
    if (workers.size() >= static_cast<std::size_t>(settings.associations + kAtTheDoor)) {
        LogFile::warnf("A connection from %s is closed: there are too many", hostOf(peer).constData());
        ::close(taken);
        return true;
    }
    const auto worker = workers.emplace(workers.end());
    worker->thread = std::thread([this, worker, taken, host = hostOf(peer)] { serve(worker, taken, host); });
    return true;
}

void DimseListener::Private::serve(std::list<Worker>::iterator worker, int taken, const QByteArray& peer)
{
    associate(worker, taken, peer);
    const std::lock_guard<std::mutex> lock(mutex);
    worker->isDone = true;
    ended.notify_all();
}

void DimseListener::Private::associate(std::list<Worker>::iterator worker, int taken, const QByteArray& peer)
{
    std::unique_ptr<Http::Transport> transport = std::make_unique<Http::PlainTransport>(taken);
    const std::shared_ptr<Http::TlsContext> tlsNow = context();
    if (tlsNow != nullptr)
        transport = tlsNow->accept(taken);
    PeerConnection connection(taken, std::move(transport), stopped.number(), settings.patience, PduLimits());
    const auto show = [&](PeerConnection* breakable, bool isAssociation) {
        const std::lock_guard<std::mutex> lock(mutex);
        worker->connection = breakable;
        worker->isAssociation = isAssociation;
    };
    show(&connection, false);
    if (connection.receiveRequest() && isTrusted(connection, peer)) {
        show(&connection, true);
        answer(connection, peer);
    }
    show(nullptr, false);
}

bool DimseListener::Private::isTrusted(const PeerConnection& connection, const QByteArray& peer) const
{
    if (!settings.tls || !settings.tls->needsCertificate || !connection.certificate().isEmpty())
        return true;
    LogFile::warnf("A connection from %s is closed: it showed no certificate", peer.constData());
    return false;
}

void DimseListener::Private::answer(PeerConnection& connection, const QByteArray& peer)
{
    DcmtkAssociation made = door->enter(connection, PduLimits().pdu);
    if (made == nullptr)
        return;
    Caller caller;
    caller.address = peer;
    caller.certificate = connection.certificate();
    const bool hasRoom = ++associations <= settings.associations;
    {
        Association association(std::move(made), connection, caller, settings, providers, observer, ++count);
        if (hasRoom)
            association.run();
        else
            association.rejectForNow();
    }
    --associations;
}

void DimseListener::Private::reap()
{
    std::list<Worker> done;
    {
        const std::lock_guard<std::mutex> lock(mutex);
        for (auto worker = workers.begin(); worker != workers.end();) {
            const auto next = std::next(worker);
            if (worker->isDone)
                done.splice(done.end(), workers, worker);
            worker = next;
        }
    }
    for (Worker& worker : done)
        worker.thread.join();
}

void DimseListener::Private::breakOff(bool alsoAssociations)
{
    for (const Worker& worker : workers) {
        if (worker.connection != nullptr && (alsoAssociations || !worker.isAssociation))
            worker.connection->breakOff();
    }
}

void DimseListener::stop()
{
    if (!d->acceptor.joinable())
        return;
    const quint64 one = 1;
    // Fails when it was written to before.
    [[maybe_unused]] const ssize_t written = ::write(d->stopped.number(), &one, sizeof one);
    d->acceptor.join();
    {
        std::unique_lock<std::mutex> lock(d->mutex);
        const auto areDone = [this] {
            return std::all_of(d->workers.begin(), d->workers.end(),
                               [](const Private::Worker& worker) { return worker.isDone; });
        };
        d->breakOff(false);
        if (!d->ended.wait_for(lock, d->settings.stop, areDone))
            LogFile::warnf("Associations are broken off: their messages took longer than there is time");
        d->breakOff(true);
        d->ended.wait(lock, areDone);
    }
    d->reap();
}

}  // namespace Kdd::Dimse
