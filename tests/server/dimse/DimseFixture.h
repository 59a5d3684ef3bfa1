#pragma once

#include "server/Server.h"
#include "server/dimse/RawCaller.h"
#include "server/http/Client.h"
#include "support/DatasetBuilder.h"
#include "support/FileContent.h"
#include "support/LogCapture.h"
#include "support/TemporaryStore.h"

#include <QDirIterator>
#include <QJsonArray>
#include <QJsonDocument>
#include <QProcess>
#include <QtEndian>

#include <dcmtk/dcmdata/dcostrmb.h>
#include <gtest/gtest.h>
#include <kddlib/Kxg.h>

namespace Kdd
{

const QByteArray kExplicit = UID_LittleEndianExplicitTransferSyntax;
const QByteArray kImplicit = UID_LittleEndianImplicitTransferSyntax;
const QByteArray kCapture = UID_SecondaryCaptureImageStorage;
const QByteArray kEcho = UID_VerificationSOPClass;

/// A server that has associations, over a store of its own.
class DimseFixture : public testing::Test
{
protected:
    DimseFixture()
    {
        Kxg::SetDatabaseServer("sqlite:" + mStore.filePath("kdd.sqlite").toUtf8());
        mSettings.http.address = {"127.0.0.1", 0};
        mSettings.objects.emplace();
        mSettings.objects->folder = mStore.filePath("objects").toUtf8();
        mSettings.objects->freeBytes = 0;
        mSettings.dimse.emplace();
        mSettings.dimse->address = {"127.0.0.1", 0};
        mSettings.dimse->rules = Dimse::AssociationRules::open();
        mSettings.dimse->rules.titles = {"KDD"};
    }

    void start()
    {
        Result result;
        mServer.reset();
        mServer = Server::make(mSettings, result);
        ASSERT_NE(mServer, nullptr) << result.text().toStdString();
        ASSERT_TRUE(mServer->start().good());
    }

    QString port() const
    {
        const QByteArray address = mServer->dimseAddress();
        return QString::fromLatin1(address.mid(address.lastIndexOf(':') + 1));
    }

    struct Said
    {
        int exitCode = -1;
        QByteArray text;
    };

    /// A tool of DCMTK's, which is told where the server is; `files` come last.
    std::unique_ptr<QProcess> begin(const char* program, const QStringList& options = {},
                                    const QStringList& files = {}, const char* called = "KDD") const
    {
        auto process = std::make_unique<QProcess>();
        process->setProcessChannelMode(QProcess::MergedChannels);
        process->start(QLatin1String(program),
                       QStringList{QStringLiteral("-v"), QStringLiteral("-aec"), QLatin1String(called)} +
                           options + QStringList{QStringLiteral("127.0.0.1"), port()} + files);
        return process;
    }

    static Said finish(QProcess& process)
    {
        EXPECT_TRUE(process.waitForFinished(120000)) << process.errorString().toStdString();
        return {process.exitStatus() == QProcess::NormalExit ? process.exitCode() : -1, process.readAll()};
    }

    Said run(const char* program, const QStringList& options = {}, const QStringList& files = {},
             const char* called = "KDD") const
    {
        return finish(*begin(program, options, files, called));
    }

    QString save(const DatasetBuilder& image, const char* name,
                 E_TransferSyntax syntax = EXS_LittleEndianExplicit) const
    {
        const QString path = mStore.filePath(name);
        DcmDataset copy(image.build());
        DcmFileFormat format(&copy);
        EXPECT_TRUE(format.saveFile(path.toUtf8().constData(), syntax).good());
        return path;
    }

    /// The bytes of a dataset alone.
    static QByteArray bytesOf(const DatasetBuilder& image, E_TransferSyntax syntax = EXS_LittleEndianExplicit)
    {
        QByteArray bytes(1 << 20, 0);
        DcmOutputBufferStream stream(bytes.data(), bytes.size());
        DcmDataset copy(image.build());
        copy.transferInit();
        EXPECT_TRUE(copy.write(stream, syntax, EET_UndefinedLength, nullptr).good());
        copy.transferEnd();
        return bytes.left(static_cast<int>(stream.filled()));
    }

    /// Stores over an association of its own.
    int store(const DatasetBuilder& image, const QByteArray& instance = "1.2.3.1",
              const QByteArray& sopClass = kCapture) const
    {
        RawCaller caller(mServer->dimseAddress());
        caller.associate({{sopClass, {kExplicit}}});
        return caller.store(sopClass, instance, bytesOf(image));
    }

    Reply get(const QByteArray& path) const
    {
        Client client(mServer->address());
        client.get("/dicom-web" + path);
        return client.reply();
    }

    int instances(const QByteArray& study = "1.2") const
    {
        return QJsonDocument::fromJson(get("/studies/" + study + "/instances").body).array().size();
    }

    QStringList storedFiles() const
    {
        QStringList names;
        QDirIterator files(mStore.filePath("objects"), {QStringLiteral("*.dcm")}, QDir::Files,
                           QDirIterator::Subdirectories);
        while (files.hasNext())
            names.append(files.next());
        return names;
    }

    LogCapture mLog;
    TemporaryStore mStore;
    ServerSettings mSettings;
    std::unique_ptr<Server> mServer;
};

}  // namespace Kdd
