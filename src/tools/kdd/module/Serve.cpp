#include "server/Server.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/ServeRequest.h"
#include "tools/kdd/ServerSignals.h"
#include "tools/kdd/module/DimseOptions.h"
#include "tools/kdd/module/ServerRuns.h"

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

std::optional<BackgroundCheck::Pace> checkPace()
{
    if (ExResource::checkRate() == 0)
        return {};
    BackgroundCheck::Pace pace;
    pace.bytesPerSecond = ExResource::checkRate() * qint64(1024 * 1024);
    pace.again = std::chrono::hours(ExResource::checkHours());
    pace.heals = ExResource::checkHeals();
    pace.records = ExResource::takesFileDigests();
    return pace;
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
    settings.check = checkPace();
    settings.provesTagFiles = ExResource::serverProvesTagFiles();
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

}  // namespace

Outcome runServe(const GlobalOptions& options, const ServeRequest& request)
{
    ServerSettings settings;
    if (!readSettings(options, request, settings))
        return Outcome::WrongUsage;
    loadForLongRun();
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

}  // namespace Kdd
