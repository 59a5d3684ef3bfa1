#pragma once

#include "platform/base/IfAbsent.h"
#include "platform/base/Result.h"
#include "platform/database/AnswerWatch.h"
#include "platform/database/DatabaseAddress.h"

#include <QByteArray>
#include <QSqlError>
#include <QSqlQuery>
#include <QVariant>

#include <chrono>
#include <functional>
#include <map>
#include <memory>
#include <stdexcept>

namespace Kxg
{

/// Why the database could not do something, in its own words. Thrown inside this folder only: `attempt` stands at its
/// border.
class DatabaseError : public std::runtime_error
{
public:
    explicit DatabaseError(const QString& reason, bool isBusy = false)
        : std::runtime_error(reason.toStdString())
        , mIsBusy(isBusy)
    {
    }

    /// Others are in the way, and the engine did not wait for them as long as it was told to.
    bool isBusy() const { return mIsBusy; }

private:
    bool mIsBusy;
};

/// Runs `work`; a DatabaseError of it becomes a failure that names the database.
Kdd::Result attempt(const DatabaseAddress& address, const std::function<void()>& work);

/// A text as both engines take it: what is no UTF-8 is replaced, and NUL, which one of them refuses, is left out.
QVariant textValue(const QByteArray& text);
QVariant bytesValue(const QByteArray& bytes);

class SqlConnection;

/// The answer to a question, row by row. The connection must outlive it, and no other statement may run over it before
/// the last row that is wanted is read: rows come from the engine one by one.
class SqlRows
{
public:
    SqlRows(QSqlQuery& query, SqlConnection& connection)
        : mQuery(query)
        , mConnection(connection)
    {
    }
    ~SqlRows();
    SqlRows(const SqlRows&) = delete;
    SqlRows& operator=(const SqlRows&) = delete;

    /// On to the first or next row; false after the last one.
    bool next();

    qint64 number(int column) const { return mQuery.value(column).toLongLong(); }
    bool truth(int column) const { return mQuery.value(column).toBool(); }
    QByteArray text(int column) const { return mQuery.value(column).toString().toUtf8(); }
    QByteArray bytes(int column) const { return mQuery.value(column).toByteArray(); }

private:
    QSqlQuery& mQuery;
    SqlConnection& mConnection;
};

/// A connection to an image database. It belongs to the thread that made it. Statements are prepared once and kept, so
/// their texts must be few: values are bound and never part of a text. What fails throws DatabaseError.
///
/// A server that stands still is not waited for without end: to connect and to begin a transaction may take as long as the
/// site's setting says (ExResource::databasePatience), a statement in it kLongestWork unless the connection is told
/// otherwise.
class SqlConnection
{
public:
    using IfAbsent = Kdd::IfAbsent;  ///< of the file of an SQLite database, with its folder

    SqlConnection(DatabaseAddress address, IfAbsent ifAbsent);
    ~SqlConnection();
    SqlConnection(const SqlConnection&) = delete;
    SqlConnection& operator=(const SqlConnection&) = delete;

    const DatabaseAddress& address() const { return mAddress; }

    static constexpr std::chrono::seconds kLongestWork{600};

    /// How long a statement of a transaction may take on a server; 0: as long as it does.
    void limitWork(std::chrono::seconds most) { mWorkLimit = most; }

    /// While it lives statements may take as long as they do.
    class Unhurried
    {
    public:
        explicit Unhurried(SqlConnection& connection)
            : mConnection(connection)
            , mFormer(connection.mWorkLimit)
        {
            connection.limitWork(std::chrono::seconds(0));
        }
        ~Unhurried() { mConnection.limitWork(mFormer); }
        Unhurried(const Unhurried&) = delete;
        Unhurried& operator=(const Unhurried&) = delete;

    private:
        SqlConnection& mConnection;
        const std::chrono::seconds mFormer;
    };

    enum class Access { Read, Write };

    /// Does `work` in a transaction: all of it or, when something throws, nothing. A connection that was lost since its
    /// last use is opened anew first.
    void transact(Access access, const std::function<void()>& work);

    /// `values` stand for the question marks in `sql`.
    SqlRows ask(const QByteArray& sql, const QVariantList& values = {});

    /// The same for a statement of which there are too many to be kept; until the next one of these. A server gets it with
    /// its values, since to prepare and to forget it would be two messages more; and it may be any that cannot be
    /// prepared, too.
    SqlRows askOnce(const QByteArray& sql, const QVariantList& values);

    /// From now on a transaction begins only while the tables have this version: another program may change them at any
    /// time, and one that does not know them must neither write nor read them.
    void holdToSchema(int version) { mSchemaVersion = version; }

    /// How many rows were changed.
    int change(const QByteArray& sql, const QVariantList& values = {});

    /// A statement that is neither prepared nor kept.
    void execute(const QString& sql);

private:
    struct Opened;
    friend class SqlRows;

    AnswerWatch::Wait waiting() const;
    [[noreturn]] void fail(const QSqlError& error) const;
    void giveUp();
    QSqlQuery& execute(QSqlQuery& query, const QVariantList& values);
    QString withValues(const QByteArray& sql, const QVariantList& values) const;
    QSqlQuery& run(const QByteArray& sql, const QVariantList& values);
    void begin(Access access);
    void beginOnce(Access access);
    void rollBack() noexcept;
    void checkSchema();
    bool isAlive();
    void open(IfAbsent ifAbsent);

    const DatabaseAddress mAddress;
    std::chrono::seconds mWorkLimit = kLongestWork;
    std::chrono::seconds mLimit = kLongestWork;  // of the statements that come now
    std::unique_ptr<Opened> mOpened;
    std::map<QByteArray, QSqlQuery> mStatements;  // of mOpened, and gone before it
    std::unique_ptr<QSqlQuery> mOnce;             // likewise
    int mSchemaVersion = 0;                       // that the tables are to have; 0: any
};

}  // namespace Kxg
