#include "platform/database/Schema.h"

#include "platform/database/SqlConnection.h"
#include "platform/database/SqlDialect.h"

#include <QThread>

#include <iterator>

namespace Kxg
{
namespace
{

constexpr int kAttempts = 1500;
constexpr unsigned long kPause = 20;  // [ms]

// Step n leads from version n to n + 1. A step that was released is never changed: a change is a new step.
//
// Names of attributes are those of DICOM. A study or series is described once a DICOM file of it was registered; volume
// files say nothing of it. The kinds of files are those of FileKind.
const QStringList kSteps[] = {
    {
        QStringLiteral("CREATE TABLE schema_version (version BIGINT NOT NULL)"),
        QStringLiteral("INSERT INTO schema_version (version) VALUES (0)"),
        QStringLiteral(
            "CREATE TABLE study (id {id}, uid {text} NOT NULL UNIQUE,"
            " is_described SMALLINT NOT NULL DEFAULT 0,"
            " patient_name {text} NOT NULL DEFAULT '', patient_id {text} NOT NULL DEFAULT '',"
            " patient_birth_date {text} NOT NULL DEFAULT '', patient_sex {text} NOT NULL DEFAULT '',"
            " study_date {text} NOT NULL DEFAULT '', study_time {text} NOT NULL DEFAULT '',"
            " study_description {text} NOT NULL DEFAULT '', accession_number {text} NOT NULL DEFAULT '')"),
        QStringLiteral(
            "CREATE TABLE series (id {id}, study_id BIGINT NOT NULL REFERENCES study (id),"
            " uid {text} NOT NULL, is_described SMALLINT NOT NULL DEFAULT 0,"
            " series_number {text} NOT NULL DEFAULT '', series_description {text} NOT NULL DEFAULT '',"
            " modality {text} NOT NULL DEFAULT '', series_date {text} NOT NULL DEFAULT '',"
            " series_time {text} NOT NULL DEFAULT '', station_name {text} NOT NULL DEFAULT '',"
            " UNIQUE (study_id, uid))"),
        QStringLiteral("CREATE TABLE file (path {bytes} NOT NULL PRIMARY KEY, size BIGINT NOT NULL,"
                       " modified BIGINT NOT NULL, kind SMALLINT NOT NULL,"
                       " series_id BIGINT REFERENCES series (id), sop_uid {text} NOT NULL)"),
        QStringLiteral("CREATE INDEX file_of_series ON file (series_id)"),
        QStringLiteral("CREATE TABLE build_request (id {id},"
                       " study_id BIGINT NOT NULL REFERENCES study (id) ON DELETE CASCADE)"),
        QStringLiteral("CREATE INDEX build_request_of_study ON build_request (study_id)"),
        QStringLiteral(
            "CREATE TABLE config (section {text} NOT NULL, name {text} NOT NULL, value {bytes} NOT NULL,"
            " PRIMARY KEY (section, name))"),
    },
    {
        QStringLiteral("ALTER TABLE file ADD COLUMN is_damaged SMALLINT NOT NULL DEFAULT 0"),
    },
};

QString firstRow(SqlConnection& connection, const QString& question)
{
    SqlRows rows = connection.ask(question.toLatin1());
    return rows.next() ? QString::fromUtf8(rows.text(0)) : QString();
}

/// 0 when there are no tables yet.
int schemaVersion(SqlConnection& connection)
{
    const SqlDialect& dialect = SqlDialect::of(connection.address().engine);
    if (firstRow(connection, dialect.hasSchema).toInt() == 0)
        return 0;
    return firstRow(connection, QStringLiteral("SELECT version FROM schema_version")).toInt();
}

[[noreturn]] void refuse(int version)
{
    throw DatabaseError(QStringLiteral("its tables have version %1, this program works with version %2")
                            .arg(version)
                            .arg(currentSchemaVersion()));
}

/// SQLite refuses some of these at once while others use the database, however long it is told to wait.
void executePatiently(SqlConnection& connection, const QString& statement)
{
    for (int attempt = 1;; ++attempt) {
        try {
            return connection.execute(statement);
        } catch (const DatabaseError& error) {
            if (!error.isBusy() || attempt == kAttempts)
                throw;
        }
        QThread::msleep(kPause);
    }
}

void takeStep(SqlConnection& connection, int version)
{
    const SqlDialect& dialect = SqlDialect::of(connection.address().engine);
    for (QString statement : kSteps[version]) {
        statement.replace(QLatin1String("{id}"), dialect.id);
        statement.replace(QLatin1String("{text}"), dialect.text);
        statement.replace(QLatin1String("{bytes}"), dialect.bytes);
        connection.execute(statement);
    }
    connection.execute(QStringLiteral("UPDATE schema_version SET version = %1").arg(version + 1));
}

void migrate(SqlConnection& connection)
{
    // Asked again: another process may have done it while this one waited for its turn to write.
    const int version = schemaVersion(connection);
    if (version > currentSchemaVersion())
        refuse(version);
    for (int step = version; step < currentSchemaVersion(); ++step)
        takeStep(connection, step);
}

}  // namespace

int currentSchemaVersion()
{
    return static_cast<int>(std::size(kSteps));
}

void bringSchemaUpToDate(SqlConnection& connection)
{
    const int version = schemaVersion(connection);
    if (version == currentSchemaVersion())
        return;
    if (version == 0)
        for (const QString& statement : SqlDialect::of(connection.address().engine).beforeSchema)
            executePatiently(connection, statement);
    connection.transact(SqlConnection::Access::Write, [&] { migrate(connection); });
}

void requireCurrentSchema(SqlConnection& connection)
{
    const int version = schemaVersion(connection);
    if (version == 0)
        throw DatabaseError(QStringLiteral("it has no tables of an image database"));
    if (version != currentSchemaVersion())
        refuse(version);
}

}  // namespace Kxg
