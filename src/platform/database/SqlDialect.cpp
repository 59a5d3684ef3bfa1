#include "platform/database/SqlDialect.h"

namespace Kxg
{
namespace
{

SqlDialect sqlite()
{
    SqlDialect dialect;
    dialect.driver = QStringLiteral("QSQLITE");
    // [ms]; as long as the server's lock_timeout below.
    dialect.connectOptions = QStringLiteral("QSQLITE_BUSY_TIMEOUT=30000");
    // Without it the engine passes over what tables refer to.
    dialect.afterOpening << QStringLiteral("PRAGMA foreign_keys = ON");
    // What is registered is told to whoever sent it, and has to be there after a power cut too.
    dialect.afterOpening << QStringLiteral("PRAGMA synchronous = FULL");
    // Readers and the writer then do not wait for each other.
    dialect.beforeSchema << QStringLiteral("PRAGMA journal_mode = WAL");
    dialect.beginReading << QStringLiteral("BEGIN");
    // A transaction that began by reading cannot wait for another writer: it would have to be repeated.
    dialect.beginWriting << QStringLiteral("BEGIN IMMEDIATE");
    dialect.hasSchema = QStringLiteral("SELECT COUNT(*) FROM sqlite_master WHERE name = 'schema_version'");
    // Without the last word the number of a deleted row would be given out again.
    dialect.id = QStringLiteral("INTEGER PRIMARY KEY AUTOINCREMENT");
    // By this very word a key is the row's own number, and needs no index.
    dialect.key = QStringLiteral("INTEGER");
    dialect.text = QStringLiteral("TEXT");
    dialect.bytes = QStringLiteral("BLOB");
    dialect.alsoInIndex = QStringLiteral(", ");
    dialect.bytesOf = QStringLiteral("CAST(%1 AS BLOB)");
    dialect.holds = QStringLiteral("instr(%1, ?) > 0");
    dialect.isOneOf = QStringLiteral("IN (SELECT value FROM json_each(?))");
    dialect.list = QStringLiteral("[%1]");
    dialect.wordsOf = QStringLiteral("%1 GLOB ?");
    dialect.hasMatchIndex = true;
    return dialect;
}

SqlDialect postgres()
{
    SqlDialect dialect;
    dialect.driver = QStringLiteral("QPSQL");
    // Either side notices within a minute or so that the other one's machine is gone; the server then gives back
    // what the connection held.
    dialect.connectOptions = QStringLiteral(
        "application_name=kdd;connect_timeout=%1;"
        "keepalives=1;keepalives_idle=30;keepalives_interval=10;keepalives_count=3;"
        "options='-c lock_timeout=30s -c tcp_keepalives_idle=30 -c tcp_keepalives_interval=10 "
        "-c tcp_keepalives_count=3 "
        // Every statement of ours is short: to compile it or to share it among processes takes longer.
        "-c jit=off -c max_parallel_workers_per_gather=0'");
    // Notices such as that a table exists already would go to standard error.
    dialect.afterOpening << QStringLiteral("SET client_min_messages = error");
    // What is registered has to be there after a power cut, whatever the server was set up for.
    dialect.afterOpening << QStringLiteral("SELECT set_config('synchronous_commit', 'on', false)"
                                           " WHERE current_setting('synchronous_commit') = 'off'");
    dialect.beginReading << QStringLiteral("BEGIN ISOLATION LEVEL REPEATABLE READ, READ ONLY");
    // One writer at a time, as with the other engine: else a series could be found empty and removed while another
    // transaction adds to it, and two that touch the same studies in different order would block each other.
    dialect.beginWriting
        // Named, for a server may be set up for another: then a writer would not see what was written while he waited.
        << QStringLiteral("BEGIN ISOLATION LEVEL READ COMMITTED")
        << QStringLiteral("SELECT pg_advisory_xact_lock(%1, %2)").arg(kAdvisoryLocks).arg(kWriterLock);
    // Told at the transaction's end, and once however often it is said in one.
    dialect.tellOfWork = QStringLiteral("NOTIFY ") + QLatin1String(kWorkChannel);
    // A function that looks a name up, such as to_regclass, would answer from a cache within a transaction that waited
    // for another one to make the table.
    dialect.hasSchema =
        QStringLiteral("SELECT COUNT(*) FROM pg_tables"
                       " WHERE tablename = 'schema_version' AND schemaname = current_schema()");
    dialect.id = QStringLiteral("BIGINT GENERATED ALWAYS AS IDENTITY PRIMARY KEY");
    dialect.key = QStringLiteral("BIGINT");
    // In the order of bytes, as with the other engine, whatever language the server was set up for.
    dialect.text = QStringLiteral("TEXT COLLATE \"C\"");
    dialect.bytes = QStringLiteral("BYTEA");
    dialect.alsoInIndex = QStringLiteral(") INCLUDE (");
    dialect.bytesOf = QStringLiteral("convert_to(%1, 'UTF8')");
    dialect.holds = QStringLiteral("position(CAST(? AS BYTEA) IN %1) > 0");
    dialect.isOneOf = QStringLiteral("= ANY (CAST(? AS BIGINT[]))");
    dialect.list = QStringLiteral("{%1}");
    dialect.wordsOf = QStringLiteral("%1 LIKE ?");
    dialect.isRemote = true;
    return dialect;
}

}  // namespace

const SqlDialect& SqlDialect::of(DatabaseAddress::Engine engine)
{
    static const SqlDialect kSqlite = sqlite();
    static const SqlDialect kPostgres = postgres();
    return engine == DatabaseAddress::Engine::Sqlite ? kSqlite : kPostgres;
}

QByteArray SqlDialect::pattern(const QByteArray& stars) const
{
    QByteArray written;
    for (const char each : stars) {
        if (hasMatchIndex)
            written += each == '[' || each == '?' ? QByteArray("[") + each + ']' : QByteArray(1, each);
        else if (each == '*')
            written += '%';
        else
            written +=
                each == '%' || each == '_' || each == '\\' ? QByteArray("\\") + each : QByteArray(1, each);
    }
    return written;
}

}  // namespace Kxg
