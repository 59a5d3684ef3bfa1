#include "support/PostgresServer.h"

#include <QDir>
#include <QProcess>
#include <QTemporaryDir>

#include <grp.h>
#include <gtest/gtest.h>
#include <pwd.h>
#include <sys/prctl.h>
#include <unistd.h>

#include <csignal>
#include <memory>
#include <stdexcept>

namespace Kdd
{
namespace
{

constexpr int kPatience = 60000;  // [ms]

/// Starts a program of the server's package, which refuses to run as an administrator, so that it dies with us.
void start(QProcess& process, const QString& program, const QString& arguments)
{
    const QDir versions(QStringLiteral("/usr/lib/postgresql"));
    const QString folder = versions.filePath(versions.entryList(QDir::Dirs | QDir::NoDotAndDotDot).value(0));
    QString command = QStringLiteral("setpriv --pdeathsig QUIT ");
    if (::geteuid() == 0)
        command += QStringLiteral("--reuid nobody --regid nogroup --clear-groups ");
    command += folder + QStringLiteral("/bin/") + program + QLatin1Char(' ') + arguments;
    process.setProcessChannelMode(QProcess::MergedChannels);
    process.start(QStringLiteral("sh"), {QStringLiteral("-c"), QStringLiteral("exec ") + command});
}

void expect(QProcess& process, const char* line)
{
    QByteArray said;
    while (!said.contains(line)) {
        if (!process.waitForReadyRead(kPatience))
            throw std::runtime_error("PostgreSQL server: " + said.toStdString());
        said += process.readAll();
    }
}

struct Server
{
    Server()
    {
        if (::geteuid() == 0)
            QProcess::execute(QStringLiteral("chown"), {QStringLiteral("nobody"), folder.path()});
        program.setWorkingDirectory(folder.path());
        // With the order of a language, so that what relies on the order of bytes must ask for it.
        start(
            program, QStringLiteral("initdb"),
            QStringLiteral("-D data -U kdd -A trust -E UTF8 --no-sync --locale=C.UTF-8 --locale-provider=icu"
                           " --icu-locale=en-US"));
        expect(program, "Success");
        program.waitForFinished(kPatience);
        const auto options =
            QStringLiteral("-D data -k %1 -c listen_addresses= -c fsync=off -c log_min_messages=log");
        start(program, QStringLiteral("postgres"), options.arg(folder.path()));
        expect(program, "ready to accept connections");
    }
    ~Server()
    {
        ::kill(static_cast<pid_t>(program.processId()), SIGINT);  // ends the connections, too
        program.waitForFinished(kPatience);
    }
    Server(const Server&) = delete;
    Server& operator=(const Server&) = delete;

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

void runOnPostgres(const QByteArray& sql)
{
    const QString address = QString::fromUtf8(postgresAddress("postgres"));
    QProcess client;
    client.start(QStringLiteral("psql"), {QStringLiteral("-c"), QString::fromUtf8(sql), address});
    if (!client.waitForFinished(kPatience) || client.exitCode() != 0)
        throw std::runtime_error(client.readAllStandardError().toStdString());
}

}  // namespace Kdd
