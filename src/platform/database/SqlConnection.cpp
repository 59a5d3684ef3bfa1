#include "platform/database/SqlConnection.h"

#include "platform/database/SqlDialect.h"
#include "platform/database/SqliteFile.h"

#include <QSqlDatabase>
#include <QSqlError>

#include <atomic>
#include <utility>

namespace Kxg
{
namespace
{

DatabaseError errorOf(const QSqlError& error)
{
    const QString said = error.databaseText().simplified();
    const bool isBusy =
        error.nativeErrorCode() == QLatin1String("5");  // SQLite's; PostgreSQL's have five characters
    return DatabaseError(said.isEmpty() ? error.driverText().simplified() : said, isBusy);
}

/// Connections are known by name among all threads.
QString uniqueName()
{
    static std::atomic<int> sCount{0};
    return QStringLiteral("kdd-%1").arg(++sCount);
}

}  // namespace

Kdd::Result attempt(const DatabaseAddress& address, const std::function<void()>& work)
{
    try {
        work();
        return {};
    } catch (const DatabaseError& error) {
        return Kdd::Result::failure(QString::fromUtf8(error.what()))
            .within(QStringLiteral("Database %1").arg(address.shown));
    }
}

QVariant textValue(const QByteArray& text)
{
    // With its length: the conversion of a whole array would end at the first NUL.
    QString value = QString::fromUtf8(text.constData(), text.size());
    value.remove(QChar(0));
    // A null string would be bound as NULL.
    return value.isNull() ? QStringLiteral("") : value;
}

QVariant bytesValue(const QByteArray& bytes)
{
    return bytes.isNull() ? QByteArray("") : bytes;
}

bool SqlRows::next()
{
    if (mQuery.next())
        return true;
    if (mQuery.lastError().isValid())
        throw errorOf(mQuery.lastError());
    return false;
}

// ---- opening

/// A handle of Qt's and its place in Qt's list, which may be given up only when nobody holds the handle any more.
struct SqlConnection::Opened
{
    Opened(const DatabaseAddress& address, const SqlDialect& dialect, IfAbsent ifAbsent)
        : file(address, ifAbsent)
        , name(uniqueName())
        , database(QSqlDatabase::addDatabase(dialect.driver, name))
    {
        database.setDatabaseName(file.name());
        database.setHostName(address.host);
        database.setPort(address.port);
        database.setUserName(address.user);
        database.setPassword(address.password);
        database.setConnectOptions(file.isFixed() ? QStringLiteral("QSQLITE_OPEN_READONLY;QSQLITE_OPEN_URI")
                                                  : dialect.connectOptions);
    }
    ~Opened()
    {
        database.close();
        database = QSqlDatabase();
        QSqlDatabase::removeDatabase(name);
    }
    Opened(const Opened&) = delete;
    Opened& operator=(const Opened&) = delete;

    SqliteFile file;
    const QString name;
    QSqlDatabase database;
};

SqlConnection::SqlConnection(DatabaseAddress address, IfAbsent ifAbsent)
    : mAddress(std::move(address))
{
    open(ifAbsent);
}

SqlConnection::~SqlConnection() = default;

void SqlConnection::open(IfAbsent ifAbsent)
{
    mOnce.reset();
    mStatements.clear();
    mOpened.reset();
    const SqlDialect& dialect = SqlDialect::of(mAddress.engine);
    // Opening would only say that no driver is loaded.
    if (!QSqlDatabase::isDriverAvailable(dialect.driver))
        throw DatabaseError(QStringLiteral("Qt's database driver %1 is not installed").arg(dialect.driver));
    auto opened = std::make_unique<Opened>(mAddress, dialect, ifAbsent);
    if (!opened->database.open())
        throw errorOf(opened->database.lastError());
    opened->file.note();
    mOpened = std::move(opened);
    for (const QString& statement : dialect.afterOpening)
        execute(statement);
}

bool SqlConnection::isAlive()
{
    return mOpened && !mOpened->file.isAnother() &&
           QSqlQuery(mOpened->database).exec(QStringLiteral("SELECT 1"));
}

// ---- transactions

void SqlConnection::beginOnce(Access access)
{
    // The engine goes on with a file that was moved away or replaced, and would never show what is in its place.
    if (mOpened && mOpened->file.isAnother())
        throw DatabaseError(QStringLiteral("its file is another one by now"));
    const SqlDialect& dialect = SqlDialect::of(mAddress.engine);
    for (const QString& statement : access == Access::Read ? dialect.beginReading : dialect.beginWriting)
        execute(statement);
}

void SqlConnection::begin(Access access)
{
    try {
        beginOnce(access);
    } catch (const DatabaseError&) {
        // A connection that was lost since its last use shows here, when no work of the transaction is lost
        // with it.
        rollBack();
        // It lives, so the refusal is the engine's own, for example because others write.
        if (isAlive())
            throw;
        // A database that was there is not made anew, empty.
        open(IfAbsent::Fail);
        beginOnce(access);
    }
}

void SqlConnection::rollBack() noexcept
{
    // What cannot be rolled back is lost with its connection; the caller reports the first error, not this one.
    if (mOpened)
        QSqlQuery(mOpened->database).exec(QStringLiteral("ROLLBACK"));
}

void SqlConnection::transact(Access access, const std::function<void()>& work)
{
    begin(access);
    try {
        checkSchema();
        work();
        // What was read of a fixed file while somebody changed it may be anything.
        if (access == Access::Read && mOpened->file.isFixed() && mOpened->file.isAnother())
            throw DatabaseError(QStringLiteral("its file was changed while it was read"));
        execute(QStringLiteral("COMMIT"));
    } catch (...) {
        // Whatever was thrown, no transaction may stay open: the connection is used again.
        rollBack();
        throw;
    }
}

/// Within the transaction: whoever changes tables waits for it, or it for him.
void SqlConnection::checkSchema()
{
    if (mSchemaVersion == 0)
        return;
    SqlRows rows = ask("SELECT version FROM schema_version");
    const qint64 version = rows.next() ? rows.number(0) : 0;
    if (version != mSchemaVersion)
        throw DatabaseError(
            QStringLiteral("its tables have version %1 by now, this program works with version %2")
                .arg(version)
                .arg(mSchemaVersion));
}

// ---- statements

QSqlQuery& SqlConnection::run(const QByteArray& sql, const QVariantList& values)
{
    if (!mOpened)
        throw DatabaseError(QStringLiteral("the connection is lost"));
    auto found = mStatements.find(sql);
    if (found == mStatements.end()) {
        QSqlQuery query(mOpened->database);
        // Rows come one by one and are not kept, since lists may be long.
        query.setForwardOnly(true);
        if (!query.prepare(QString::fromLatin1(sql)))
            throw errorOf(query.lastError());
        found = mStatements.emplace(sql, query).first;
    }
    return execute(found->second, values);
}

QSqlQuery& SqlConnection::execute(QSqlQuery& query, const QVariantList& values)
{
    for (int i = 0; i < values.size(); ++i)
        query.bindValue(i, values[i]);
    if (!query.exec())
        throw errorOf(query.lastError());
    return query;
}

SqlRows SqlConnection::ask(const QByteArray& sql, const QVariantList& values)
{
    return SqlRows(run(sql, values));
}

SqlRows SqlConnection::askOnce(const QByteArray& sql, const QVariantList& values)
{
    if (!mOpened)
        throw DatabaseError(QStringLiteral("the connection is lost"));
    mOnce = std::make_unique<QSqlQuery>(mOpened->database);
    mOnce->setForwardOnly(true);
    if (!mOnce->prepare(QString::fromLatin1(sql)))
        throw errorOf(mOnce->lastError());
    return SqlRows(execute(*mOnce, values));
}

int SqlConnection::change(const QByteArray& sql, const QVariantList& values)
{
    QSqlQuery& query = run(sql, values);
    const int rows = query.numRowsAffected();
    query.finish();
    return rows;
}

void SqlConnection::execute(const QString& sql)
{
    if (!mOpened)
        throw DatabaseError(QStringLiteral("the connection is lost"));
    QSqlQuery query(mOpened->database);
    if (!query.exec(sql))
        throw errorOf(query.lastError());
}

}  // namespace Kxg
