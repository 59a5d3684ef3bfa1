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
    void serve(const QByteArray& options = {}, const QByteArray& shell = {}, const QByteArray& runner = {})
    {
        mServer = std::make_unique<QProcess>();
        // A pipe that nobody empties would hold it up.
        mServer->setStandardErrorFile(path("log"));
        // Without a terminal, as services are.
        const QByteArray command = shell + " exec setsid " + runner + " " KDD_BINARY " --json --store " +
                                   path("store").toUtf8() +
                                   " serve --listen 127.0.0.1:0 --status 127.0.0.1:0 " + options;
        mServer->start(QStringLiteral("sh"), {QStringLiteral("-c"), QString::fromUtf8(command)});
        ASSERT_TRUE(mServer->waitForReadyRead(kTimeout)) << fileContent(path("log")).toStdString();
        const QByteArray told = mServer->readLine();
        mAddress = jsonAt(told, "address").toString().toLatin1();
        mStatus = jsonAt(told, "status").toString().toLatin1();
        mDicom = jsonAt(told, "dicom").toString().toLatin1();
    }

    void signal(int number) const { ::kill(static_cast<pid_t>(mServer->processId()), number); }

    /// Its exit code; -1 when it did not end by itself.
    int end(int number = SIGTERM)
    {
        if (mServer == nullptr || mServer->state() == QProcess::NotRunning)
            return -1;
        signal(number);
        EXPECT_TRUE(mServer->waitForFinished(kTimeout));
        EXPECT_FALSE(fileContent(path("log")).contains("runtime error"));
        return mServer->exitStatus() == QProcess::NormalExit ? mServer->exitCode() : -1;
    }

    /// A path below that of DICOMweb.
    Reply get(const QByteArray& target, const QByteArray& headers = {}) const
    {
        Client client(mAddress);
        return client.ask("/dicom-web/" + target, headers);
    }

    /// With a body.
    Reply ask(const QByteArray& method, const QByteArray& target, const QByteArray& type,
              const QByteArray& body) const
    {
        Client client(mAddress);
        client.send(method + " /dicom-web/" + target + " HTTP/1.1\r\nHost: localhost\r\nContent-Type: " +
                    type + "\r\nContent-Length: " + QByteArray::number(body.size()) + "\r\n\r\n" + body);
        return client.reply();
    }

    Reply status(const char* page) const
    {
        Client client(mStatus);
        return client.ask(page);
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
