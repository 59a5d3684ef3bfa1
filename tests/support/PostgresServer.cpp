#include "support/PostgresServer.h"

#include "support/FileContent.h"

#include <QDir>
#include <QProcess>
#include <QTemporaryDir>

#include <gtest/gtest.h>

#include <csignal>
#include <memory>
#include <stdexcept>

namespace Kdd
{
namespace
{

constexpr int kPatience = 60000;  // [ms]

/// Refuses to run as an administrator, and dies with us. With the order of a language, so that what relies on the order of
/// bytes must ask for it.
constexpr char kStart[] =
    R"(set -- /usr/lib/postgresql/*/bin
if [ $(id -u) = 0 ]; then chown nobody . && S="--reuid nobody --regid nogroup --clear-groups"; fi
exec setpriv --pdeathsig QUIT $S sh -c "[ -d data ] || $1/initdb -D data -U kdd -A trust -E UTF8 --no-sync \
--locale=C.UTF-8 --locale-provider=icu --icu-locale=en-US && exec $1/postgres -D data -k $PWD -c listen_addresses= -c fsync=off \
-c log_min_messages=log")";

struct Server
{
    Server() { start(); }
    ~Server() { stop(); }
    Server(const Server&) = delete;
    Server& operator=(const Server&) = delete;

    void start()
    {
        program.setWorkingDirectory(folder.path());
        program.setProcessChannelMode(QProcess::MergedChannels);
        program.start(QStringLiteral("sh"), {QStringLiteral("-c"), QString::fromLatin1(kStart)});
        QByteArray said;
        while (!said.contains("ready to accept connections")) {
            if (!program.waitForReadyRead(kPatience))
                throw std::runtime_error("PostgreSQL server: " + said.toStdString());
            said += program.readAll();
        }
    }

    void stop()
    {
        ::kill(static_cast<pid_t>(program.processId()), SIGINT);  // ends the connections, too
        program.waitForFinished(kPatience);
    }

    /// To the one that others are made by first, so that none is missed.
    void signal(int number) const
    {
        const QByteArray parent = QByteArray::number(program.processId());
        ::kill(static_cast<pid_t>(program.processId()), number);
        for (const QString& process : QDir(QStringLiteral("/proc")).entryList(QDir::Dirs)) {
            const QByteArray status = fileContent(QStringLiteral("/proc/%1/status").arg(process));
            if (status.contains("\nPPid:\t" + parent + '\n'))
                ::kill(process.toInt(), number);
        }
    }

    QTemporaryDir folder{QDir::tempPath() + QStringLiteral("/kddpg")};
    QProcess program;
    int databases = 0;
};

std::unique_ptr<Server> sServer;

Server& server()
{
    if (!sServer)
        sServer = std::make_unique<Server>();
    return *sServer;
}

class ServerEnd : public testing::Environment
{
public:
    void TearDown() override { sServer.reset(); }
};

const testing::Environment* const kServerEnd = testing::AddGlobalTestEnvironment(new ServerEnd);

}  // namespace

QByteArray postgresAddress(const QByteArray& database)
{
    return "postgresql://kdd@/" + database + "?host=" + server().folder.path().toUtf8();
}

QByteArray newPostgresDatabase()
{
    const QByteArray name = "test" + QByteArray::number(++server().databases);
    runOnPostgres("CREATE DATABASE " + name);
    return postgresAddress(name);
}

void stopPostgres()
{
    server().stop();
}

void startPostgres()
{
    server().start();
}

FrozenPostgres::FrozenPostgres()
{
    server().signal(SIGSTOP);
}

FrozenPostgres::~FrozenPostgres()
{
    server().signal(SIGCONT);
}

void runOnPostgres(const QByteArray& sql, const QByteArray& address)
{
    QProcess client;
    client.start(QStringLiteral("psql"),
                 {QStringLiteral("-c"), QString::fromUtf8(sql), QString::fromUtf8(address)});
    if (!client.waitForFinished(kPatience) || client.exitCode() != 0)
        throw std::runtime_error(client.readAllStandardError().toStdString());
}

}  // namespace Kdd
