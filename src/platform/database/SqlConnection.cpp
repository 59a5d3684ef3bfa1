#include "platform/database/SqlConnection.h"

#include "platform/database/SqlDialect.h"
#include "platform/database/SqliteFile.h"
#include "platform/late/LateLibrary.h"
#include "platform/resources/ExResource.h"

#include <QSqlDatabase>
#include <QSqlDriver>
#include <QSqlError>
#include <QSqlField>

#include <atomic>
#include <utility>

namespace Kxg
{
namespace
{

/// How long a writer waits for his turn; the server's lock_timeout.
constexpr std::chrono::seconds kTurn(30);

DatabaseError errorOf(const QSqlError& error)
{
    const QString said = error.databaseText().simplified();
    const bool isBusy =
        error.nativeErrorCode() == QLatin1String("5");  // SQLite's; PostgreSQL's have five characters
    return DatabaseError(said.isEmpty() ? error.driverText().simplified() : said, isBusy);
}

std::chrono::seconds patience()
{
    return std::chrono::seconds(Kdd::ExResource::databasePatience());
}

/// Connections are known by name among all threads.
QString uniqueName()
{
    static std::atomic<int> sCount{0};
    return QStringLiteral("kdd-%1").arg(++sCount);
}

void refuseSilent(const DatabaseAddress& address)
{
    if (!SilentServers::mayAsk(address.shown.toUtf8()))
        throw DatabaseError(QStringLiteral("its server did not answer a moment ago"));
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

SqlRows::~SqlRows()
{
    // What was not read comes nevertheless.
    const AnswerWatch::Wait wait = mConnection.waiting();
    mQuery.finish();
}

bool SqlRows::next()
{
    const AnswerWatch::Wait wait = mConnection.waiting();
    if (mQuery.next())
        return true;
    if (mQuery.lastError().isValid())
        mConnection.fail(mQuery.lastError());
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
        QString options = dialect.connectOptions;
        if (dialect.isRemote)
            options = options.arg(patience().count());
        database.setConnectOptions(file.isFixed() ? QStringLiteral("QSQLITE_OPEN_READONLY;QSQLITE_OPEN_URI")
                                                  : options);
    }
    ~Opened()
    {
        watch.reset();
        database.close();
        database = QSqlDatabase();
        QSqlDatabase::removeDatabase(name);
    }
    Opened(const Opened&) = delete;
    Opened& operator=(const Opened&) = delete;

    SqliteFile file;
    const QString name;
    QSqlDatabase database;
    std::unique_ptr<AnswerWatch> watch;
};

SqlConnection::SqlConnection(DatabaseAddress address, IfAbsent ifAbsent)
    : mAddress(std::move(address))
{
    refuseSilent(mAddress);
    open(ifAbsent);
}

SqlConnection::~SqlConnection() = default;

void SqlConnection::open(IfAbsent ifAbsent)
{
    giveUp();
    if (const Kdd::Result loaded = Kdd::loadLate(Kdd::LateLibrary::Database); loaded.bad())
        throw DatabaseError(loaded.text());
    const SqlDialect& dialect = SqlDialect::of(mAddress.engine);
    // Opening would only say that no driver is loaded.
    if (!QSqlDatabase::isDriverAvailable(dialect.driver))
        throw DatabaseError(QStringLiteral("Qt's database driver %1 is not installed").arg(dialect.driver));
    auto opened = std::make_unique<Opened>(mAddress, dialect, ifAbsent);
    const auto begin = std::chrono::steady_clock::now();
    const bool isOpen = opened->database.open();
    // The driver counts in whole seconds, from the beginning of the one that it starts in.
    const bool isSilent = !isOpen && std::chrono::steady_clock::now() - begin > patience() / 2;
    (isSilent ? SilentServers::noteSilence : SilentServers::noteAnswer)(mAddress.shown.toUtf8());
    if (!isOpen)
        throw errorOf(opened->database.lastError());
    opened->file.note();
    opened->watch = std::make_unique<AnswerWatch>(opened->database.driver()->handle());
    mOpened = std::move(opened);
    for (const QString& statement : dialect.afterOpening)
        execute(statement);
}

AnswerWatch::Wait SqlConnection::waiting() const
{
    return {*mOpened->watch, mLimit};
}

void SqlConnection::fail(const QSqlError& error) const
{
    if (!mOpened->watch->hasEnded())
        throw errorOf(error);
    SilentServers::noteSilence(mAddress.shown.toUtf8());
    throw DatabaseError(QStringLiteral("its server did not answer within %1 s").arg(mLimit.count()));
}

void SqlConnection::giveUp()
{
    mOnce.reset();
    mStatements.clear();
    mOpened.reset();
}

bool SqlConnection::isAlive()
{
    if (!mOpened)
        return false;
    const AnswerWatch::Wait wait = waiting();
    return !mOpened->file.isAnother() && QSqlQuery(mOpened->database).exec(QStringLiteral("SELECT 1"));
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
    refuseSilent(mAddress);
    mLimit = patience() + (access == Access::Write ? kTurn : std::chrono::seconds(0));
    try {
        beginOnce(access);
    } catch (const DatabaseError&) {
        if (mOpened && mOpened->watch->hasEnded()) {
            giveUp();
            throw;
        }
        // A connection that was lost since its last use shows here, when no work of the transaction is lost
        // with it.
        rollBack();
        // It lives, so the refusal is the engine's own, for example because others write.
        if (isAlive()) {
            SilentServers::noteAnswer(mAddress.shown.toUtf8());
            throw;
        }
        // A database that was there is not made anew, empty.
        open(IfAbsent::Fail);
        beginOnce(access);
    }
    SilentServers::noteAnswer(mAddress.shown.toUtf8());
    mLimit = mWorkLimit;
}

void SqlConnection::rollBack() noexcept
{
    // What cannot be rolled back is lost with its connection; the caller reports the first error, not this one.
    if (!mOpened)
        return;
    const AnswerWatch::Wait wait = waiting();
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
        const AnswerWatch::Wait wait = waiting();
        if (!query.prepare(QString::fromLatin1(sql)))
            fail(query.lastError());
        found = mStatements.emplace(sql, query).first;
    }
    return execute(found->second, values);
}

QSqlQuery& SqlConnection::execute(QSqlQuery& query, const QVariantList& values)
{
    for (int i = 0; i < values.size(); ++i)
        query.bindValue(i, values[i]);
    const AnswerWatch::Wait wait = waiting();
    if (!query.exec())
        fail(query.lastError());
    return query;
}

SqlRows SqlConnection::ask(const QByteArray& sql, const QVariantList& values)
{
    return {run(sql, values), *this};
}

SqlRows SqlConnection::askOnce(const QByteArray& sql, const QVariantList& values)
{
    if (!mOpened)
        throw DatabaseError(QStringLiteral("the connection is lost"));
    mOnce = std::make_unique<QSqlQuery>(mOpened->database);
    mOnce->setForwardOnly(true);
    if (SqlDialect::of(mAddress.engine).isRemote) {
        const AnswerWatch::Wait wait = waiting();
        if (!mOnce->exec(withValues(sql, values)))
            fail(mOnce->lastError());
        return {*mOnce, *this};
    }
    if (!mOnce->prepare(QString::fromLatin1(sql)))
        fail(mOnce->lastError());
    return {execute(*mOnce, values), *this};
}

/// Written by the driver, which writes the values of prepared statements in the same way.
QString SqlConnection::withValues(const QByteArray& sql, const QVariantList& values) const
{
    const QList<QByteArray> pieces = sql.split('?');
    QString text = QString::fromLatin1(pieces.front());
    for (int i = 0; i < values.size(); ++i) {
        QSqlField field(QString(), values[i].type());
        field.setValue(values[i]);
        text += mOpened->database.driver()->formatValue(field) + QString::fromLatin1(pieces.value(i + 1));
    }
    return text;
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
    const AnswerWatch::Wait wait = waiting();
    if (!query.exec(sql))
        fail(query.lastError());
}

}  // namespace Kxg
