#include "server/Server.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/DimseOptions.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/ServerSignals.h"

#include <QFile>

#include <kddlib/ExResource.h>
#include <kddlib/Kxg.h>
#include <kddlib/LogFile.h>
#include <kddlib/PathName.h>

#include <algorithm>
#include <cstdio>
#include <memory>
#include <thread>

namespace Kdd
{

namespace
{

/// What is empty or 0 is left to the site's settings.
struct ServeRequest
{
    QByteArray listen;
    QByteArray status;
    QString access;
    QString certificate;
    QString key;
    int threads = 0;
    QString viewer;
    QByteArray publicAddress;
    QList<QByteArray> hosts;
    bool stow = false;
    DimseRequest dimse;
    bool corrections = false;
    bool deletions = false;
};

QVector<QByteArray> wordsOf(QByteArray text)
{
    QVector<QByteArray> words;
    for (const QByteArray& word : text.replace(',', ' ').split(' '))
        if (!word.isEmpty())
            words.append(word);
    return words;
}

QByteArray orElse(const QByteArray& given, const QByteArray& setting)
{
    return given.isEmpty() ? setting : given;
}

bool readAddress(const QByteArray& text, Http::ListenAddress& address)
{
    if (Http::ListenAddress::parse(text, address))
        return true;
    LogFile::errorf("\"%s\" is no address to listen at: write one like 127.0.0.1:8042 or [::1]:8042",
                    text.constData());
    return false;
}

bool readTls(const ServeRequest& request, Http::HttpSettings& http)
{
    http.certificateFile = orElse(pathBytes(request.certificate), ExResource::serverCertificate());
    http.keyFile = orElse(pathBytes(request.key), ExResource::serverKey());
    if (http.certificateFile.isEmpty() == http.keyFile.isEmpty())
        return true;
    LogFile::errorf("TLS takes both a certificate and a key");
    return false;
}

int threadCount(const ServeRequest& request)
{
    const int wanted = request.threads > 0 ? request.threads : ExResource::serverThreads();
    return wanted > 0 ? wanted : std::max(4, 2 * static_cast<int>(std::thread::hardware_concurrency()));
}

/// Nothing is decided where nothing is named.
bool readAccess(const ServeRequest& request, std::optional<Access::AccessRules>& access)
{
    const QString named =
        request.access.isEmpty() ? QFile::decodeName(ExResource::serverAccess()) : request.access;
    if (named.isEmpty())
        return true;
    if (named == QLatin1String("none")) {
        access = Access::AccessRules::open();
        return true;
    }
    const Result result = Access::AccessRules::read(named, access.emplace());
    if (result.bad())
        LogFile::errorf("The access file cannot be followed: %s", qUtf8Printable(result.text()));
    return result.good();
}

void readLimits(const ServeRequest& request, Http::HttpSettings& http)
{
    http.workers = threadCount(request);
    http.connections = ExResource::serverConnections();
    http.requests = ExResource::serverRequests();
    http.patience = std::chrono::seconds(ExResource::serverPatience());
    http.stop = std::chrono::seconds(ExResource::serverStop());
}

/// False, with the reason logged, when something is written that is none.
bool readSettings(const GlobalOptions& options, const ServeRequest& request, ServerSettings& settings)
{
    const QByteArray status = orElse(request.status, ExResource::serverStatus());
    if (!readAddress(orElse(request.listen, ExResource::serverListen()), settings.http.address) ||
        (!status.isEmpty() && !readAddress(status, settings.status.emplace())) ||
        !readTls(request, settings.http) || !readAccess(request, settings.access))
        return false;
    readLimits(request, settings.http);
    settings.prefix = ExResource::serverPrefix();
    settings.viewer =
        request.viewer.isEmpty() ? QFile::decodeName(ExResource::serverViewer()) : request.viewer;
    settings.slow = std::chrono::milliseconds(ExResource::serverSlow());
    settings.addresses.publicAddress = orElse(request.publicAddress, ExResource::serverPublicAddress());
    settings.addresses.hosts = wordsOf(ExResource::serverHosts()) + request.hosts.toVector();
    settings.addresses.proxies = wordsOf(ExResource::serverProxies());
    settings.changes.corrections = request.corrections || ExResource::serverTakesCorrections();
    settings.changes.deletions = request.deletions || ExResource::serverDeletes();
    settings.takesByRequest = request.stow || ExResource::serverTakesObjects();
    settings.store.requestBytes = ExResource::serverRequestSize() * qint64(1024 * 1024);
    DimseOrder order;
    if (!readDimse(request.dimse, order))
        return false;
    settings.dimse = order.settings;
    settings.isDimseDecided = order.isDecided;
    settings.dimseAudit = order.audit;
    return !(settings.takesByRequest || settings.dimse) ||
           readObjectRules(options, settings.objects.emplace());
}

void tellAddress(const GlobalOptions& options, const Server& server, bool hasViewer)
{
    const QString address = QString::fromLatin1(server.address());
    const QString status = QString::fromLatin1(server.statusAddress());
    if (options.json) {
        QJsonObject told = {{QStringLiteral("address"), address}, {QStringLiteral("status"), status}};
        if (!server.dimseAddress().isEmpty())
            told.insert(QStringLiteral("dicom"), QString::fromLatin1(server.dimseAddress()));
        printJson(told);
    } else {
        std::printf("Serving at %s\n", qUtf8Printable(address));
        if (hasViewer)
            std::printf("Viewer at %s/viewer/\n", qUtf8Printable(address));
        if (!status.isEmpty())
            std::printf("Watched at %s\n", qUtf8Printable(status));
        if (!server.dimseAddress().isEmpty())
            std::printf("Associations at %s\n", server.dimseAddress().constData());
    }
    std::fflush(stdout);
}

/// A server may come before its database does, so that this is no reason not to begin.
void warnOfNoArchive()
{
    Result result;
    if (Kxg::Catalogue::openExisting(Kxg::DatabaseServer(), result) == nullptr)
        LogFile::warnf("There is no archive here yet: %s", qUtf8Printable(result.text()));
}

Outcome runServe(const GlobalOptions& options, const ServeRequest& request)
{
    ServerSettings settings;
    if (!readSettings(options, request, settings))
        return Outcome::WrongUsage;
    const ServerSignals received;
    const bool hasViewer = !settings.viewer.isEmpty();
    Result result;
    const std::unique_ptr<Server> server = Server::make(settings, result);
    if (server != nullptr)
        result = server->start();
    if (result.bad()) {
        LogFile::errorf("Cannot serve: %s", qUtf8Printable(result.text()));
        return Outcome::Failed;
    }
    warnOfNoArchive();
    tellAddress(options, *server, hasViewer);
    received.awaitEnd(
        [&] { renewCertificate(server->hasCertificate(), [&] { return server->renewCertificate(); }); });
    server->stop();
    return Outcome::Done;
}

}  // namespace

void declareServe(CommandSet& commands)
{
    const CommandText text = {
        "serve", kServing, "Answer DICOMweb requests over HTTP",
        "Runs until it is interrupted, and answers the requests in flight before it ends. It listens only "
        "where no other machine reaches it until --access says who may do what. What has no option here is a "
        "setting of the site, as each option is.",
        "kdd serve\n"
        "kdd serve --viewer viewer --public https://images.example.org\n"
        "kdd serve --dicom 11112                # and for modalities of this machine"};
    const auto request = std::make_shared<ServeRequest>();
    ArgumentList arguments = commands.declare(
        text, [request](const GlobalOptions& options) { return runServe(options, *request); });
    arguments.text({"--listen", kListenAddress, "Where to wait for requests (default: 127.0.0.1:8042)"},
                   request->listen);
    arguments.text(
        {"--status", kListenAddress, "Where to answer /healthz, /readyz and /metrics (default: nowhere)"},
        request->status);
    arguments.path({"--access", "FILE|none", "Who may do what (default: all, from this machine only)"},
                   request->access);
    arguments.path({"--tls-cert", kFile, "Certificate and those above it, in PEM (default: no TLS)"},
                   request->certificate);
    arguments.path({"--tls-key", kFile, "The certificate's key, in PEM"}, request->key);
    arguments.number("--threads", 1, 1000, request->threads,
                     "Requests answered at a time (default: twice the processors, at least 4)");
    arguments.path({"--viewer", kFolder, "Folder of a viewer's files, served under /viewer"},
                   request->viewer);
    arguments.text({"--public", kUrl, "Address under which clients reach the server"},
                   request->publicAddress);
    arguments.flag("--stow", request->stow, "Take objects that clients send (STOW-RS)");
    request->dimse.addTo(arguments);
    arguments.flag("--corrections", request->corrections,
                   "Take corrections of what is stored, and moves between studies");
    arguments.flag("--deletions", request->deletions, "Delete studies, series and images when asked to");
    arguments.texts({"--host", "NAME", "Further name by which the server may be asked; may be repeated"},
                    request->hosts);
}

}  // namespace Kdd
