#pragma once

#include "server/http/Client.h"
#include "support/BytesRead.h"
#include "support/Setting.h"
#include "support/Threads.h"
#include "system/CommandLineFixture.h"

#include <chrono>
#include <csignal>

namespace Kdd
{

/// A store, and a server over it in a process of its own.
class Served : public CommandLine
{
protected:
    ~Served() override { end(SIGKILL); }

    /// `shell` runs before it in its process, for example "ulimit -n 100;"; `runner` runs it.
    void serve(const QStringList& options = {}, const char* shell = "", const char* runner = "")
    {
        mServer = std::make_unique<QProcess>();
        // A pipe that nobody empties would hold it up.
        mServer->setStandardErrorFile(path("log"));
        // Without a terminal, as services are.
        const QString command = QLatin1String(shell) + QStringLiteral(" exec setsid ") +
                                QLatin1String(runner) + QStringLiteral(" \"$0\" \"$@\"");
        const QStringList words{QStringLiteral("--store"),  path("store"),
                                QStringLiteral("--json"),   QStringLiteral("serve"),
                                QStringLiteral("--listen"), QStringLiteral("127.0.0.1:0"),
                                QStringLiteral("--status"), QStringLiteral("127.0.0.1:0")};
        mServer->start(QStringLiteral("sh"),
                       QStringList{QStringLiteral("-c"), command, QStringLiteral(KDD_BINARY)} + words +
                           options);
        ASSERT_TRUE(mServer->waitForReadyRead(kTimeout)) << fileContent(path("log")).toStdString();
        const QJsonObject told = QJsonDocument::fromJson(mServer->readLine()).object();
        mAddress = told.value(QLatin1String("address")).toString().toLatin1();
        mStatus = told.value(QLatin1String("status")).toString().toLatin1();
        mDicom = told.value(QLatin1String("dicom")).toString().toLatin1();
    }

    void signal(int number) const { ::kill(static_cast<pid_t>(mServer->processId()), number); }

    /// Its exit code; -1 when it did not end by itself.
    int end(int number = SIGTERM)
    {
        if (mServer == nullptr || mServer->state() == QProcess::NotRunning)
            return -1;
        signal(number);
        EXPECT_TRUE(mServer->waitForFinished(kTimeout));
        return mServer->exitStatus() == QProcess::NormalExit ? mServer->exitCode() : -1;
    }

    /// A path below that of DICOMweb.
    Reply get(const QByteArray& target, const QByteArray& headers = {}) const
    {
        Client client(mAddress);
        client.get("/dicom-web/" + target, headers);
        return client.reply();
    }

    Reply status(const char* page) const
    {
        Client client(mStatus);
        client.get(page);
        return client.reply();
    }

    qint64 openDescriptors() const
    {
        return QDir(QStringLiteral("/proc/%1/fd").arg(mServer->processId()))
            .entryList(QDir::NoDotAndDotDot | QDir::AllEntries | QDir::System)
            .size();
    }

    qint64 memory() const { return residentMemory(QString::number(mServer->processId())); }

    /// Whether the condition comes true while the server is asked, which takes longer than what it has to do.
    template <typename Condition>
    bool comesTrue(const Condition& condition) const
    {
        // Longer than a server refuses of its own accord to ask a database that did not answer.
        constexpr std::chrono::seconds kPatience(60);
        const auto begin = std::chrono::steady_clock::now();
        while (std::chrono::steady_clock::now() - begin < kPatience) {
            if (condition())
                return true;
            status("/healthz");
        }
        return false;
    }

    bool hasNoConnections() const
    {
        return comesTrue([this] { return status("/metrics").body.contains("\nkdd_http_connections 0\n"); });
    }

    /// An image of frames of 1 MiB, each word of them `value` and the frame's number.
    static DatasetBuilder aLargeImage(int frames, quint16 value, const char* sopUID = "1")
    {
        std::vector<Uint16> words(static_cast<std::size_t>(frames) * 1024 * 512);
        for (std::size_t i = 0; i < words.size(); ++i)
            words[i] = static_cast<Uint16>(value + i / (1024 * 512));
        DatasetBuilder image = anImage(sopUID);
        image.asPicture(512, 1024, 16).with(DCM_NumberOfFrames, QByteArray::number(frames));
        return image.words(words);
    }

    std::unique_ptr<QProcess> mServer;
    QByteArray mAddress;
    QByteArray mStatus;
    QByteArray mDicom;  // where it has associations
};

}  // namespace Kdd
