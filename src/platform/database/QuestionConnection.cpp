#include "platform/database/QuestionConnection.h"

#include "platform/database/Kxg.h"
#include "platform/database/Schema.h"
#include "platform/database/SqlConnection.h"

#include <QMutex>
#include <QMutexLocker>

namespace Kxg
{
namespace
{

QMutex sMutex;
QByteArray sAddress;  // guarded by sMutex

/// A thread's connection, closed when the thread ends.
struct ThreadConnection
{
    QByteArray address;  // as it was set, for noticing that another one was
    std::unique_ptr<SqlConnection> connection;
};

ThreadConnection& threadConnection()
{
    thread_local ThreadConnection tConnection;
    return tConnection;
}

void openConnection(const QByteArray& address, const DatabaseAddress& parsed)
{
    ThreadConnection& own = threadConnection();
    if (own.connection && own.address == address)
        return;
    // Another address than before ends the old connection, also when the new one cannot be opened.
    own = {};
    auto connection = std::make_unique<SqlConnection>(parsed, SqlConnection::IfAbsent::Fail);
    // Asking changes no tables, so those of an older program are refused as well.
    requireCurrentSchema(*connection);
    own = {address, std::move(connection)};
}

}  // namespace

void SetDatabaseServer(const QByteArray& address)
{
    const QMutexLocker locker(&sMutex);
    sAddress = address;
}

QByteArray DatabaseServer()
{
    const QMutexLocker locker(&sMutex);
    return sAddress;
}

Kdd::Result askDatabase(const std::function<void(SqlConnection&)>& work)
{
    const QByteArray address = DatabaseServer();
    DatabaseAddress parsed;
    Kdd::Result result = DatabaseAddress::parse(address, parsed);
    if (result.bad())
        return result;
    return attempt(parsed, [&] {
        openConnection(address, parsed);
        SqlConnection& connection = *threadConnection().connection;
        connection.transact(SqlConnection::Access::Read, [&] { work(connection); });
    });
}

void noteUser(SqlConnection& connection, const QByteArray& user)
{
    // For the connection and not only for the transaction.
    if (connection.address().engine == DatabaseAddress::Engine::Postgres)
        connection.ask("SELECT set_config('application_name', ?, false)", {textValue("kdd " + user)});
}

}  // namespace Kxg
