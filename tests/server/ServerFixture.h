#pragma once

#include "server/Server.h"
#include "server/http/Client.h"
#include "support/DatasetBuilder.h"
#include "support/FileContent.h"
#include "support/LogCapture.h"
#include "support/TemporaryStore.h"

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QProcess>

#include <gtest/gtest.h>
#include <kddlib/Catalogue.h>
#include <kddlib/Kxg.h>

#include <stdexcept>

namespace Kdd
{

/// Of a server on a port of its own.
inline ServerSettings onFreePort()
{
    ServerSettings settings;
    settings.http.address = {"127.0.0.1", 0};
    return settings;
}

inline void takeObjects(ServerSettings& settings, const QString& folder)
{
    settings.objects.emplace();
    settings.objects->folder = folder.toUtf8();
    settings.objects->freeBytes = 0;
}

inline void takeAssociations(ServerSettings& settings)
{
    settings.dimse.emplace();
    settings.dimse->address = {"127.0.0.1", 0};
    settings.dimse->rules = Dimse::AssociationRules::open();
}

/// One that does not begin throws.
inline std::unique_ptr<Server> started(const ServerSettings& settings)
{
    Result result;
    std::unique_ptr<Server> server = Server::make(settings, result);
    if (server != nullptr)
        result = server->start();
    if (result.bad())
        throw std::runtime_error(result.text().toStdString());
    return server;
}

/// What a server is asked over a connection of its own, with a body or none.
inline Reply ask(const Server& server, const QByteArray& method, const QByteArray& path,
                 const QByteArray& headers = {}, const QByteArray& body = {})
{
    Client client(server.address());
    client.send(method + ' ' + path + " HTTP/1.1\r\nHost: localhost\r\nContent-Length: " +
                QByteArray::number(body.size()) + "\r\n" + headers + "\r\n" + body);
    return client.reply(method == "HEAD" ? Client::Body::StaysBehind : Client::Body::Follows);
}

inline quint16 dicomPort(const Server& server)
{
    const QByteArray address = server.dimseAddress();
    return address.mid(address.lastIndexOf(':') + 1).toUShort();
}

/// The arguments of a command line, which are parted by blanks.
inline QStringList words(const QByteArray& line)
{
    return QString::fromUtf8(line).split(QLatin1Char(' '), Qt::SkipEmptyParts);
}

/// Runs the tool over a store with its tag files and a database; its exit code.
inline int runTool(const QString& store, const QByteArray& database, const QStringList& arguments)
{
    QProcess process;
    process.start(QStringLiteral(KDD_BINARY),
                  words("--quiet --store " + store.toUtf8() + " --database " + database) + arguments);
    EXPECT_TRUE(process.waitForFinished(120000));
    EXPECT_EQ(process.exitStatus(), QProcess::NormalExit) << process.readAllStandardError().constData();
    return process.exitCode();
}

/// A server over a store of its own. It takes nothing and has no associations until a test's settings say so.
class ServerFixture : public testing::Test
{
protected:
    explicit ServerFixture(const QByteArray& database = {})
        : mDatabase(database.isEmpty() ? "sqlite:" + mStore.filePath("kdd.sqlite").toUtf8() : database)
    {
        Kxg::SetDatabaseServer(mDatabase);
    }

    void takeObjects() { Kdd::takeObjects(mSettings, mStore.filePath("objects")); }

    void start()
    {
        mServer.reset();
        mServer = started(mSettings);
    }

    std::string refusal() const
    {
        Result result;
        EXPECT_EQ(Server::make(mSettings, result), nullptr);
        return result.text().toStdString();
    }

    Reply ask(const QByteArray& method, const QByteArray& path, const QByteArray& headers = {},
              const QByteArray& body = {}) const
    {
        return Kdd::ask(*mServer, method, path, headers, body);
    }
    /// A path below that of DICOMweb.
    Reply get(const QByteArray& path, const QByteArray& headers = {}) const
    {
        return ask("GET", "/dicom-web" + path, headers);
    }

    int instances(const QByteArray& study = "1.2") const
    {
        return QJsonDocument::fromJson(get("/studies/" + study + "/instances").body).array().size();
    }

    std::unique_ptr<Kxg::Catalogue> catalogue() const
    {
        Result result;
        return Kxg::Catalogue::open(mDatabase, result);
    }

    QStringList storedFiles() const
    {
        return filesBelow(mStore.filePath("objects"), {QStringLiteral("*.dcm")});
    }

    /// Runs the tool over the same archive, which has to succeed.
    void kdd(const QByteArray& arguments) const
    {
        EXPECT_EQ(runTool(mStore.folder(), mDatabase, words(arguments)), 0) << arguments.constData();
    }

    LogCapture mLog;
    TemporaryStore mStore;
    QByteArray mDatabase;
    ServerSettings mSettings = onFreePort();
    std::unique_ptr<Server> mServer;
};

}  // namespace Kdd
