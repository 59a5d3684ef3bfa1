#include "tools/kdd/module/DimseOptions.h"

#include "server/PeersFile.h"
#include "tools/kdd/Store.h"

#include <QFile>

#include <kddlib/ExResource.h>
#include <kddlib/LogFile.h>

namespace Kdd
{

namespace
{

/// A port alone is one of this machine.
bool readAddress(const QByteArray& text, Http::ListenAddress& address)
{
    const bool isPort = !text.contains(':');
    if (Http::ListenAddress::parse(isPort ? "127.0.0.1:" + text : text, address))
        return true;
    LogFile::errorf("\"%s\" is no address for associations: write a port, or one like 10.0.0.5:11112",
                    text.constData());
    return false;
}

QVector<QByteArray> titlesOf(const QByteArray& text)
{
    QVector<QByteArray> titles;
    for (const QByteArray& title : text.split(','))
        titles.append(title.trimmed());
    return titles.contains("*") ? QVector<QByteArray>() : titles;
}

bool areTitles(const QVector<QByteArray>& titles)
{
    for (const QByteArray& title : titles) {
        if (title.isEmpty() || title.size() > 16) {
            LogFile::errorf("\"%s\" is no application entity title: it has 1 to 16 letters",
                            title.constData());
            return false;
        }
    }
    return true;
}

/// Nothing is decided where nothing is named.
bool readPeers(const QString& named, DimseOrder& order)
{
    Dimse::DimseSettings& settings = *order.settings;
    order.isDecided = !named.isEmpty();
    settings.rules = Dimse::AssociationRules::open();
    if (named.isEmpty() || named == QLatin1String("none"))
        return true;
    PeersFile file;
    const Result result = PeersFile::read(named, file);
    if (result.bad()) {
        LogFile::errorf("The peers file cannot be followed: %s", qUtf8Printable(result.text()));
        return false;
    }
    settings.rules = file.rules;
    settings.tls = file.tls;
    order.audit = file.audit;
    return true;
}

}  // namespace

bool readDimse(const DimseRequest& request, DimseOrder& order)
{
    const QByteArray listen = request.listen.isEmpty() ? ExResource::dicomListen() : request.listen;
    if (listen.isEmpty())
        return true;
    Dimse::DimseSettings& settings = order.settings.emplace();
    const QString peers =
        request.peers.isEmpty() ? QFile::decodeName(ExResource::dicomPeers()) : request.peers;
    if (!readAddress(listen, settings.address) || !readPeers(peers, order))
        return false;
    settings.rules.titles = titlesOf(request.title.isEmpty() ? ExResource::dicomTitle() : request.title);
    settings.associations = ExResource::dicomAssociations();
    settings.idle = std::chrono::seconds(ExResource::dicomIdle());
    settings.patience = std::chrono::seconds(ExResource::serverPatience());
    settings.stop = std::chrono::seconds(ExResource::serverStop());
    return areTitles(settings.rules.titles);
}

bool readObjectRules(const GlobalOptions& options, ObjectRules& rules)
{
    constexpr qint64 kMiB = 1024 * 1024;
    const QByteArray sameUid = ExResource::sameUid();
    if (sameUid != "refuse" && sameUid != "replace") {
        LogFile::errorf("What becomes of objects of the same UID is \"refuse\" or \"replace\", not \"%s\"",
                        sameUid.constData());
        return false;
    }
    rules.folder = objectFolder(options);
    rules.sameUid = sameUid == "replace" ? SameUid::Replace : SameUid::Refuse;
    rules.freeBytes = ExResource::freeSpace() * kMiB;
    rules.objectBytes = ExResource::objectSize() * kMiB;
    return true;
}

}  // namespace Kdd
