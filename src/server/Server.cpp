#include "server/Server.h"

#include "server/DatabaseWitness.h"
#include "server/DimseService.h"
#include "server/RequestLog.h"
#include "server/Resources.h"
#include "server/Router.h"
#include "server/StatusPages.h"
#include "server/ViewerFiles.h"
#include "server/access/AccessGate.h"
#include "server/access/AuditMessages.h"
#include "server/access/AuditTrail.h"
#include "server/browser/BrowserService.h"
#include "server/dicomweb/DicomWebService.h"
#include "server/http/HttpServer.h"

#include <kddlib/LogFile.h>
#include <sys/resource.h>

#include <algorithm>

namespace Kdd
{
namespace
{

const QByteArray kViewerPath = "/viewer";
const QByteArray kUriPath = "/wado";

/// Watching takes little; its own threads answer when those of the others are all busy.
Http::HttpSettings statusSettings(const ServerSettings& settings)
{
    Http::HttpSettings made = settings.http;
    made.address = settings.status.value_or(Http::ListenAddress());
    made.certificateFile.clear();
    made.keyFile.clear();
    made.clientCaFile.clear();
    made.workers = 2;
    made.ioThreads = 1;
    made.connections = 100;
    return made;
}

Result checkReach(const Http::ListenAddress& address)
{
    if (address.isLoopback())
        return {};
    return Result::failure(
        QStringLiteral("%1 can be reached by other machines, and nobody has decided who may do what: name an "
                       "access file, or \"none\" where everybody who reaches the server may do everything")
            .arg(QString::fromUtf8(address.text())));
}

/// Whether what is decided can be held to.
Result checkAccess(const ServerSettings& settings)
{
    const Access::AccessRules& rules = *settings.access;
    const bool isEncrypted = !settings.http.certificateFile.isEmpty();
    if (rules.certificates && !isEncrypted)
        return Result::failure(QStringLiteral(
            "Clients show certificates over TLS only: the server needs one itself, and a key"));
    // Whoever reads a token on its way has it.
    if (rules.tokens && !isEncrypted && !settings.http.address.isLoopback() &&
        settings.addresses.proxies.isEmpty())
        return Result::failure(
            QStringLiteral(
                "Tokens are taken over TLS only: %1 needs a certificate and a key, or the address of "
                "the proxy that ends TLS in front of it")
                .arg(QString::fromUtf8(settings.http.address.text())));
    return {};
}

Result checkReach(const ServerSettings& settings)
{
    if (settings.access)
        return checkAccess(settings);
    Result result = checkReach(settings.http.address);
    if (result.good() && settings.status)
        result = checkReach(*settings.status);
    return result;
}

/// A numeric address that it listens at is nobody else's name.
void addOwnNames(ServerSettings& settings)
{
    const auto add = [&](const Http::ListenAddress& address) {
        if (address.host != "0.0.0.0" && address.host != "::")
            settings.addresses.hosts.append(address.text());
    };
    add(settings.http.address);
    if (settings.status)
        add(*settings.status);
}

/// Descriptors for files, the database and whatever else is open beside connections.
constexpr int kOtherDescriptors = 200;

/// So many connections as the system has descriptors for: each may send a file.
int affordableConnections(int wanted)
{
    rlimit limit = {};
    if (::getrlimit(RLIMIT_NOFILE, &limit) != 0)
        return wanted;
    // What a process begins with is meant for programs that wait for all their descriptors at once.
    limit.rlim_cur = limit.rlim_max;
    ::setrlimit(RLIMIT_NOFILE, &limit);
    const auto descriptors = static_cast<qint64>(std::min<rlim_t>(limit.rlim_cur, 10'000'000));
    const auto most = static_cast<int>(std::max<qint64>(1, (descriptors - kOtherDescriptors) / 2));
    if (wanted > most)
        LogFile::printf("The system allows %d connections, not %d: it gives this process %lld descriptors",
                        most, wanted, static_cast<long long>(descriptors));
    return std::min(wanted, most);
}

/// Of what callers may have a right to.
QVector<QByteArray> possibleChanges(const ServerSettings& settings)
{
    QVector<QByteArray> changes;
    if (settings.objects)
        changes.append("store");
    if (settings.changes.corrections)
        changes.append("correct");
    if (settings.changes.deletions)
        changes.append("delete");
    return changes;
}

std::unique_ptr<Access::AuditTrail> makeTrail(const ServerSettings& settings,
                                              const QVector<QByteArray>& prefix)
{
    if (settings.access->audit.isEmpty())
        return nullptr;
    return std::make_unique<Access::AuditTrail>(settings.access->audit, Access::RightsTable(prefix),
                                                settings.addresses.proxies);
}

std::unique_ptr<Access::AuditMessages> makeMessages(const ServerSettings& settings,
                                                    const QVector<QByteArray>& prefix)
{
    if (!settings.access->syslog)
        return nullptr;
    return std::make_unique<Access::AuditMessages>(*settings.access->syslog, Access::RightsTable(prefix));
}

class Observers : public Http::ExchangeObserver
{
public:
    /// They outlive this; a null is nobody.
    explicit Observers(std::initializer_list<Http::ExchangeObserver*> all)
        : mAll(all)
    {
    }

    void ended(const Http::Exchange& exchange) override
    {
        for (Http::ExchangeObserver* each : mAll)
            if (each != nullptr)
                each->ended(exchange);
    }

private:
    const std::vector<Http::ExchangeObserver*> mAll;
};

/// Those who watch are none of whom is watched.
class Unobserved : public Http::ExchangeObserver
{
public:
    void ended(const Http::Exchange& /*exchange*/) override {}
};

}  // namespace

struct Server::Private
{
    Private(const ServerSettings& settings, std::unique_ptr<DicomWeb::ArrivalService> arrivals,
            std::unique_ptr<Access::SignIn> signIn)
        : prefix(Router::segmentsOf(settings.prefix))
        , log(metrics, prefix, settings.slow)
        , trail(makeTrail(settings, prefix))
        , messages(makeMessages(settings, prefix))
        , observers({&log, trail.get(), messages.get()})
        , statusPages(metrics)
        , gate(
              *settings.access, Access::RightsTable(prefix), settings.addresses.proxies,
              [this](const auto& limits, const QByteArray& study) {
                  return archive.sight.look(limits, study);
              },
              std::move(signIn), router)
        , guard(settings.addresses, gate)
        , statusGuard(settings.addresses, statusPages)
        , http(settings.http, guard, observers)
    {
        stopTime = settings.http.stop;
        archive.arrivals = std::move(arrivals);
        archive.storeLimits = settings.store;
        archive.takesByRequest = settings.takesByRequest;
        archive.changes = std::make_unique<DicomWeb::Turns>(settings.changes);
        archive.studies->setArrivals(archive.arrivals.get());
        archive.witness = std::make_unique<DatabaseWitness>(archive.database, settings.provesTagFiles);
        archive.studies->setWitness(archive.witness.get());
        router.add(prefix, std::make_unique<DicomWeb::DicomWebService>(prefix.size(),
                                                                       makeResources(archive, metrics)));
        router.add(Router::segmentsOf(kUriPath),
                   std::make_unique<DicomWeb::DicomWebService>(0, makeUriResources(archive)));
        Browser::BrowserSettings browser;
        browser.dicomWeb = prefix.toList().join('/');
        browser.hasViewer = !settings.viewer.isEmpty();
        browser.hasThumbnails = true;
        browser.changes = possibleChanges(settings);
        browser.hasSignIn = settings.access->signIn.has_value();
        router.add({}, std::make_unique<Browser::BrowserService>(*archive.studies, browser));
        if (settings.status)
            status = std::make_unique<Http::HttpServer>(statusSettings(settings), statusGuard, unobserved);
        if (settings.check)
            addCheck(*settings.check);
        metrics.addGauge("kdd_http_connections", "Connections that are open.",
                         [this] { return http.connections(); });
        metrics.addGauge("kdd_http_requests_in_flight", "Requests whose answers are not sent whole.",
                         [this] { return http.requestsInFlight(); });
    }

    void addCheck(const BackgroundCheck::Pace& pace)
    {
        check = std::make_unique<BackgroundCheck>(pace);
        const auto add = [this](const char* name, const char* help, auto value) {
            metrics.addGauge(name, help,
                             [this, value] { return static_cast<qint64>(check->counts().*value); });
        };
        using Counts = BackgroundCheck::Counts;
        add("kdd_check_studies", "Studies whose files were looked at, since the beginning.",
            &Counts::studies);
        add("kdd_check_bytes", "Bytes of theirs that were read, since the beginning.", &Counts::bytes);
        add("kdd_check_faults", "Files that were not as they should be, since the beginning.",
            &Counts::faults);
        add("kdd_check_healed", "Of these, tag files that were built anew.", &Counts::healed);
        add("kdd_check_faulty_studies", "Studies with such files that are not healed.", &Counts::faulty);
    }

    QVector<QByteArray> prefix;
    std::chrono::milliseconds stopTime;
    ServedArchive archive;
    Http::Metrics metrics;
    RequestLog log;
    std::unique_ptr<Access::AuditTrail> trail;
    std::unique_ptr<Access::AuditMessages> messages;
    Observers observers;
    Unobserved unobserved;
    Router router;
    StatusPages statusPages;
    Access::AccessGate gate;
    Access::AddressGuard guard;
    Access::AddressGuard statusGuard;
    Http::HttpServer http;
    std::unique_ptr<DimseService> dimse;
    std::unique_ptr<BackgroundCheck> check;
    std::unique_ptr<Http::HttpServer> status;  // the first to go: it asks all the others
};

std::unique_ptr<Server> Server::make(ServerSettings settings, Result& result)
{
    addOwnNames(settings);
    result = settings.addresses.normalise();
    if (result.good())
        result = checkReach(settings);
    std::unique_ptr<ViewerFiles> viewer;
    const QVector<QByteArray> viewerPath = Router::segmentsOf(kViewerPath);
    if (result.good() && !settings.viewer.isEmpty())
        viewer = ViewerFiles::open(settings.viewer, viewerPath.size(), result);
    std::unique_ptr<DicomWeb::ArrivalService> arrivals;
    if (result.good() && settings.objects)
        arrivals = DicomWeb::ArrivalService::make(*settings.objects, Kxg::DatabaseServer(), result);
    std::unique_ptr<Access::SignIn> signIn;
    if (result.good() && settings.access && settings.access->signIn)
        signIn = Access::SignIn::open(*settings.access->tokens, *settings.access->signIn, result);
    if (result.bad())
        return nullptr;
    settings.http.connections = affordableConnections(settings.http.connections);
    // Half of the threads at most change something, so that others are answered meanwhile.
    settings.changes.most = std::max(1, settings.http.workers / 2);
    if (!settings.access)
        settings.access = Access::AccessRules::open();
    if (settings.access->certificates)
        settings.http.clientCaFile = settings.access->certificates->caFile;
    auto made = std::make_unique<Private>(settings, std::move(arrivals), std::move(signIn));
    if (made->trail != nullptr)
        result = made->trail->check();
    if (result.good() && settings.dimse) {
        made->dimse = DimseService::make(*settings.dimse, settings.dimseAudit, settings.isDimseDecided,
                                         made->archive, result);
        if (made->dimse != nullptr)
            made->dimse->addTo(made->metrics);
    }
    if (result.bad())
        return nullptr;
    if (viewer != nullptr)
        made->router.add(viewerPath, std::move(viewer));
    return std::unique_ptr<Server>(new Server(std::move(made)));
}

Server::Server(std::unique_ptr<Private> made)
    : d(std::move(made))
{
}

Server::~Server() = default;

Result Server::start()
{
    Result result = d->http.start();
    if (result.good() && d->status != nullptr)
        result = d->status->start();
    if (result.good() && d->dimse != nullptr)
        result = d->dimse->start();
    if (result.bad())
        stop();
    else if (d->archive.arrivals != nullptr)
        d->archive.arrivals->start();
    if (result.good() && d->check != nullptr)
        d->check->start();
    return result;
}

Result Server::renewCertificate()
{
    const Result renewed = d->http.renewCertificate();
    return renewed.good() && d->dimse != nullptr ? d->dimse->renewCertificate() : renewed;
}

bool Server::hasCertificate() const
{
    return d->http.address().startsWith("https:") || (d->dimse != nullptr && d->dimse->hasCertificate());
}

/// The watchers see it to its end.
void Server::stop()
{
    d->http.stop();
    if (d->dimse != nullptr)
        d->dimse->stop();
    if (d->archive.arrivals != nullptr)
        d->archive.arrivals->stop(d->stopTime);
    if (d->check != nullptr)
        d->check->stop();
    if (d->status != nullptr)
        d->status->stop();
}

QByteArray Server::address() const
{
    return d->http.address();
}

QByteArray Server::statusAddress() const
{
    return d->status != nullptr ? d->status->address() : QByteArray();
}

QByteArray Server::dimseAddress() const
{
    return d->dimse != nullptr ? d->dimse->address().text() : QByteArray();
}

}  // namespace Kdd
