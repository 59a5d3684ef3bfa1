#include "platform/database/SearchWords.h"

#include "platform/base/LogFile.h"
#include "platform/database/SqlConnection.h"
#include "platform/database/SqlDialect.h"

namespace Kxg
{
namespace
{

const char kColumns[] =
    "patient_name, referring_physician, description, patient_id, accession_number, study_code";

// Names, which are asked for most, have an index wherever they are walked: the server then weighs the two.
const char kModalityNames[] =
    "CREATE INDEX study_modality_parts ON study_modality USING gin (name_words gin_trgm_ops)";

QStringList textIndexes()
{
    QStringList columns;
    for (const QString& column : QString::fromLatin1(kColumns).split(QStringLiteral(", ")).mid(1))
        columns << column + QStringLiteral(" gin_trgm_ops");
    return {QStringLiteral("CREATE EXTENSION IF NOT EXISTS pg_trgm"),
            QStringLiteral("CREATE INDEX study_words_parts ON study_words USING gin (%1)")
                .arg(columns.join(QStringLiteral(", "))),
            QStringLiteral(
                "CREATE INDEX study_search_parts ON study_search USING gin (name_words gin_trgm_ops)")};
}

// Whatever of it fails must leave the transaction around it whole.
bool makePostgresIndexes(SqlConnection& connection, const QStringList& statements)
{
    connection.execute(QStringLiteral("SAVEPOINT words_index"));
    try {
        for (const QString& statement : statements)
            connection.execute(statement);
        connection.execute(QStringLiteral("RELEASE SAVEPOINT words_index"));
        return true;
    } catch (const DatabaseError& error) {
        connection.execute(QStringLiteral("ROLLBACK TO SAVEPOINT words_index"));
        Kdd::LogFile::warnf(
            "Searches for parts of texts read all of them, for the server has no index for that: %s",
            error.what());
        return false;
    }
}

bool hasPostgresIndexes(SqlConnection& connection)
{
    SqlRows rows = connection.ask("SELECT 1 FROM pg_indexes WHERE indexname = 'study_words_parts'"
                                  " AND schemaname = current_schema()");
    return rows.next();
}

/// Of the row that a trigger is called for.
QString columnsOf(const char* row)
{
    QStringList columns = QString::fromLatin1(kColumns).split(QStringLiteral(", "));
    for (QString& column : columns)
        column.prepend(QLatin1String(row));
    return columns.join(QStringLiteral(", "));
}

}  // namespace

void makeWordsTable(SqlConnection& connection)
{
    const SqlDialect& dialect = SqlDialect::of(connection.address().engine);
    QString columns = QString::fromLatin1(kColumns);
    columns.replace(QLatin1String(", "), QLatin1Char(' ') + dialect.text + QLatin1String(" NOT NULL, "));
    connection.execute(
        QStringLiteral("CREATE TABLE study_words (study_id %1 NOT NULL PRIMARY KEY, %2 %3 NOT NULL)")
            .arg(dialect.key, columns, dialect.text));
    if (!dialect.hasMatchIndex) {
        makePostgresIndexes(connection, textIndexes());
        return;
    }
    // The index knows the table and is told of each change of it. So texts are read without it, too, which is faster
    // where many have the part, and where the part is too short for it.
    connection.execute(
        QStringLiteral("CREATE VIRTUAL TABLE study_parts USING fts5 (%1, content = 'study_words',"
                       " content_rowid = 'study_id', tokenize = 'trigram case_sensitive 1')")
            .arg(QLatin1String(kColumns)));
    connection.execute(QStringLiteral("CREATE TRIGGER study_words_come AFTER INSERT ON study_words BEGIN"
                                      " INSERT INTO study_parts (rowid, %1) VALUES (new.study_id, %2); END")
                           .arg(QLatin1String(kColumns), columnsOf("new.")));
    connection.execute(QStringLiteral("CREATE TRIGGER study_words_go AFTER DELETE ON study_words BEGIN"
                                      " INSERT INTO study_parts (study_parts, rowid, %1)"
                                      " VALUES ('delete', old.study_id, %2); END")
                           .arg(QLatin1String(kColumns), columnsOf("old.")));
}

void boundNames(SqlConnection& connection)
{
    {
        SqlRows rows = connection.ask("SELECT 1 FROM study_search WHERE LENGTH(name_words) > 1000 LIMIT 1");
        if (!rows.next())
            return;
    }
    // A server would still put the former rows into an index that the same transaction makes, unless it writes the whole
    // table anew.
    connection.execute(connection.address().engine == DatabaseAddress::Engine::Sqlite
                           ? QStringLiteral("UPDATE study_search SET name_words = SUBSTR(name_words, 1, 1000)"
                                            " WHERE LENGTH(name_words) > 1000")
                           : QStringLiteral("ALTER TABLE study_search ALTER COLUMN name_words TYPE TEXT"
                                            " COLLATE \"C\" USING SUBSTR(name_words, 1, 1000)"));
}

void refineStatistics(SqlConnection& connection, const char* table)
{
    if (connection.address().engine == DatabaseAddress::Engine::Sqlite)
        return;
    // The server guesses from a sample of names how many have a part. From the usual one it takes a part that one in a
    // hundred has for three times as frequent, and walks the list where the index finds them in a third of the time.
    connection.execute(QStringLiteral("ALTER TABLE %1 ALTER COLUMN name_words SET STATISTICS 1000")
                           .arg(QLatin1String(table)));
    // It would look at them of itself only after many changes.
    connection.execute(QStringLiteral("ANALYZE %1").arg(QLatin1String(table)));
}

void indexModalityNames(SqlConnection& connection)
{
    if (connection.address().engine != DatabaseAddress::Engine::Sqlite && hasPostgresIndexes(connection))
        makePostgresIndexes(connection, {QLatin1String(kModalityNames)});
}

bool obtainWordsIndex(SqlConnection& connection)
{
    return connection.address().engine == DatabaseAddress::Engine::Sqlite || hasPostgresIndexes(connection) ||
           makePostgresIndexes(connection, textIndexes() << QLatin1String(kModalityNames));
}

}  // namespace Kxg
