#include "server/http/HttpServer.h"

#include "server/http/IoThread.h"
#include "server/http/Listener.h"
#include "server/http/Session.h"
#include "server/http/TlsTransport.h"

#include <condition_variable>
#include <csignal>
#include <map>
#include <mutex>

namespace Kdd::Http
{
namespace
{

/// So many of the connections that are one too many are told so at the same time; the others are closed.
constexpr int kRefusedAtOnce = 200;

/// A thread of the I/O and the sessions that belong to it, which only that thread looks at.
struct SessionThread
{
    IoThread io;
    std::map<Session*, std::shared_ptr<Session>> sessions;
};

}  // namespace

struct HttpServer::Private
{
    Private(const HttpSettings& settings, Handler& handler, ExchangeObserver& observer)
        : workers(settings.workers)
        , receivers(settings.receivers)
        , host{settings, handler, observer, workers, receivers}
    {
        for (int i = 0; i < settings.ioThreads; ++i)
            threads.push_back(std::make_unique<SessionThread>());
    }

    void accept(int socket, const QByteArray& peer);
    void open(SessionThread& thread, int socket, const QByteArray& peer, bool isRefused);
    void closed(SessionThread& thread, Session& session);
    template <typename Each>
    void onSessions(Each each);
    bool awaitEnd(std::chrono::milliseconds time);
    std::shared_ptr<TlsContext> readCertificate(Result& result) const;
    std::shared_ptr<TlsContext> tlsContext() const { return std::atomic_load(&tls); }

    std::vector<std::unique_ptr<SessionThread>> threads;
    WorkerThreads workers;
    WorkerThreads receivers;
    SessionHost host;
    std::shared_ptr<TlsContext> tls;  // null without TLS; atomic, for it may be renewed
    std::unique_ptr<Listener> listener;
    std::size_t nextThread = 0;
    std::mutex mutex;
    std::condition_variable changed;
    std::atomic<int> connections{0};
    bool isStarted = false;
};

/// On the first thread.
void HttpServer::Private::accept(int socket, const QByteArray& peer)
{
    const int count = ++connections;
    const bool isRefused = count > host.settings.connections;
    SessionThread& thread = *threads[nextThread++ % threads.size()];
    if (count > host.settings.connections + kRefusedAtOnce || host.stops) {
        --connections;
        ::close(socket);
        return;
    }
    thread.io.post([this, &thread, socket, peer, isRefused] { open(thread, socket, peer, isRefused); });
}

void HttpServer::Private::open(SessionThread& thread, int socket, const QByteArray& peer, bool isRefused)
{
    auto connection = std::make_shared<Connection>(thread.io, socket);
    std::unique_ptr<Transport> transport;
    const std::shared_ptr<TlsContext> secure = tlsContext();
    if (secure != nullptr && !isRefused)
        transport = secure->accept(socket);
    else
        transport = std::make_unique<PlainTransport>(socket);
    const auto session =
        std::make_shared<Session>(host, std::move(connection), std::move(transport), peer,
                                  [this, &thread](Session& ended) { closed(thread, ended); });
    thread.sessions.emplace(session.get(), session);
    if (host.stops || (isRefused && secure != nullptr))
        session->abort();
    else if (isRefused)
        session->refuse();
    else
        session->begin();
}

void HttpServer::Private::closed(SessionThread& thread, Session& session)
{
    thread.sessions.erase(&session);
    // Under the lock, so that whoever waits for the last one does not miss it.
    const std::lock_guard<std::mutex> lock(mutex);
    --connections;
    changed.notify_all();
}

template <typename Each>
void HttpServer::Private::onSessions(Each each)
{
    for (const auto& thread : threads) {
        thread->io.post([each, &sessions = thread->sessions] {
            // A session that ends takes itself out.
            const auto present = sessions;
            for (const auto& [key, session] : present)
                each(*session);
        });
    }
}

std::shared_ptr<TlsContext> HttpServer::Private::readCertificate(Result& result) const
{
    const HttpSettings& settings = host.settings;
    return TlsContext::make(settings.certificateFile, settings.keyFile, settings.clientCaFile, result);
}

/// Whether all sessions came to their end.
bool HttpServer::Private::awaitEnd(std::chrono::milliseconds time)
{
    std::unique_lock<std::mutex> lock(mutex);
    return changed.wait_for(lock, time, [this] { return connections == 0; });
}

HttpServer::HttpServer(const HttpSettings& settings, Handler& handler, ExchangeObserver& observer)
    : d(std::make_unique<Private>(settings, handler, observer))
{
    std::signal(SIGPIPE, SIG_IGN);
}

HttpServer::~HttpServer()
{
    stop();
}

Result HttpServer::start()
{
    HttpSettings& settings = d->host.settings;
    if (!settings.certificateFile.isEmpty()) {
        Result result;
        d->tls = d->readCertificate(result);
        if (result.bad())
            return result;
    }
    d->listener = std::make_unique<Listener>(
        d->threads[0]->io, [this](int socket, const QByteArray& peer) { d->accept(socket, peer); });
    const Result opened = d->listener->open(settings.address);
    if (opened.bad())
        return opened;
    for (const auto& thread : d->threads)
        thread->io.start();
    d->isStarted = true;
    return {};
}

Result HttpServer::renewCertificate()
{
    Result result;
    std::shared_ptr<TlsContext> renewed;
    if (d->tlsContext() != nullptr)
        renewed = d->readCertificate(result);
    if (renewed != nullptr)
        std::atomic_store(&d->tls, renewed);
    return result;
}

void HttpServer::stop()
{
    if (!d->isStarted)
        return;
    d->isStarted = false;
    d->host.stops = true;
    // Whoever sees a connection end finds that there are no new ones either.
    d->threads[0]->io.post([this] {
        d->listener->close();
        d->onSessions([](Session& session) { session.stop(); });
    });
    if (!d->awaitEnd(d->host.settings.stop)) {
        d->onSessions([](Session& session) { session.abort(); });
        // Those that are still being answered end when their handlers do.
        std::unique_lock<std::mutex> lock(d->mutex);
        d->changed.wait(lock, [this] { return d->connections == 0; });
    }
    for (const auto& thread : d->threads)
        thread->io.stop();
}

QByteArray HttpServer::address() const
{
    const char* const scheme = d->tlsContext() != nullptr ? "https://" : "http://";
    return scheme + d->host.settings.address.text();
}

int HttpServer::connections() const
{
    return d->connections;
}

int HttpServer::requestsInFlight() const
{
    return d->host.inFlight;
}

}  // namespace Kdd::Http
