#pragma once

#include "platform/base/IfAbsent.h"
#include "platform/base/Result.h"
#include "platform/database/DatabaseAddress.h"

#include <QByteArray>
#include <QSqlQuery>
#include <QVariant>

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

/// The answer to a question, row by row. The connection must outlive it, and no other statement may run over it before
/// the last row that is wanted is read: rows come from the engine one by one.
class SqlRows
{
public:
    explicit SqlRows(QSqlQuery& query)
        : mQuery(query)
    {
    }
    ~SqlRows() { mQuery.finish(); }
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
};

/// A connection to an image database. It belongs to the thread that made it. Statements are prepared once and kept, so
/// their texts must be few: values are bound and never part of a text. What fails throws DatabaseError.
class SqlConnection
{
public:
    using IfAbsent = Kdd::IfAbsent;  ///< of the file of an SQLite database, with its folder

    SqlConnection(DatabaseAddress address, IfAbsent ifAbsent);
    ~SqlConnection();
    SqlConnection(const SqlConnection&) = delete;
    SqlConnection& operator=(const SqlConnection&) = delete;

    const DatabaseAddress& address() const { return mAddress; }

    enum class Access { Read, Write };

    /// Does `work` in a transaction: all of it or, when something throws, nothing. A connection that was lost since its
    /// last use is opened anew first.
    void transact(Access access, const std::function<void()>& work);

    /// `values` stand for the question marks in `sql`.
    SqlRows ask(const QByteArray& sql, const QVariantList& values = {});

    /// The same for a statement of which there are too many to be kept; until the next one of these.
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

    QSqlQuery& execute(QSqlQuery& query, const QVariantList& values);
    QSqlQuery& run(const QByteArray& sql, const QVariantList& values);
    void begin(Access access);
    void beginOnce(Access access);
    void rollBack() noexcept;
    void checkSchema();
    bool isAlive();
    void open(IfAbsent ifAbsent);

    const DatabaseAddress mAddress;
    std::unique_ptr<Opened> mOpened;
    std::map<QByteArray, QSqlQuery> mStatements;  // of mOpened, and gone before it
    std::unique_ptr<QSqlQuery> mOnce;             // likewise
    int mSchemaVersion = 0;                       // that the tables are to have; 0: any
};

}  // namespace Kxg
