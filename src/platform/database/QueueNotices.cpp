#include "platform/database/QueueNotices.h"

#include "platform/database/SqlDialect.h"
#include "platform/late/LateLibrary.h"

#include <libpq-fe.h>

namespace Kxg
{
namespace
{

struct Closing
{
    void operator()(PGconn* connection) const { PQfinish(connection); }
};

using Connection = std::unique_ptr<PGconn, Closing>;

Connection connectTo(const DatabaseAddress& address)
{
    const QByteArray host = address.host.toUtf8();
    const QByteArray port = address.port > 0 ? QByteArray::number(address.port) : QByteArray();
    const QByteArray user = address.user.toUtf8();
    const QByteArray password = address.password.toUtf8();
    const QByteArray database = address.database.toUtf8();
    // What is empty the client library takes from its environment, as Qt's driver has it do. The other machine's end is
    // noticed as it is there.
    const char* const names[] = {"host",
                                 "port",
                                 "user",
                                 "password",
                                 "dbname",
                                 "application_name",
                                 "connect_timeout",
                                 "keepalives",
                                 "keepalives_idle",
                                 "keepalives_interval",
                                 "keepalives_count",
                                 nullptr};
    const char* const values[] = {host.constData(),
                                  port.constData(),
                                  user.constData(),
                                  password.constData(),
                                  database.constData(),
                                  "kdd",
                                  "10",
                                  "1",
                                  "30",
                                  "10",
                                  "3",
                                  nullptr};
    return Connection(PQconnectdbParams(names, values, 0));
}

/// The reason stays with the connection.
bool listens(PGconn* connection)
{
    if (PQstatus(connection) != CONNECTION_OK)
        return false;
    PGresult* const answer = PQexec(connection, (QByteArray("LISTEN ") + kWorkChannel).constData());
    const bool isDone = PQresultStatus(answer) == PGRES_COMMAND_OK;
    PQclear(answer);
    return isDone;
}

}  // namespace

struct QueueNotices::Private
{
    Connection connection;
    const Kdd::WakeSignal& stop;
};

QueueNotices::QueueNotices(std::unique_ptr<Private> made)
    : d(std::move(made))
{
}

QueueNotices::~QueueNotices() = default;

std::unique_ptr<QueueNotices> QueueNotices::open(const DatabaseAddress& address, const Kdd::WakeSignal& stop,
                                                 Kdd::Result& result)
{
    result = Kdd::loadLate(Kdd::LateLibrary::Postgresql);
    if (result.bad())
        return nullptr;
    Connection connection = connectTo(address);
    if (!listens(connection.get())) {
        result = Kdd::Result::failure(QString::fromUtf8(PQerrorMessage(connection.get())).simplified())
                     .within(QStringLiteral("Database %1").arg(address.shown));
        return nullptr;
    }
    auto made = std::unique_ptr<Private>(new Private{std::move(connection), stop});
    return std::unique_ptr<QueueNotices>(new QueueNotices(std::move(made)));
}

QueueNotices::Heard QueueNotices::await(int ms)
{
    PGconn* const connection = d->connection.get();
    Heard heard = Heard::Nothing;
    // What came with the answer to a former question can be read from no descriptor any more.
    const auto collect = [&] {
        while (PGnotify* const notice = PQnotifies(connection)) {
            PQfreemem(notice);
            heard = Heard::Work;
        }
    };
    collect();
    if (heard == Heard::Work ||
        d->stop.await(PQsocket(connection), ms) != Kdd::WakeSignal::Woken::ByDescriptor)
        return heard;
    // At its end the descriptor can be read from for ever.
    if (PQconsumeInput(connection) == 0 || PQstatus(connection) != CONNECTION_OK)
        return Heard::Loss;
    collect();
    return heard;
}

}  // namespace Kxg
