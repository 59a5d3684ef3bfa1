#include "platform/database/SearchWords.h"

#include "platform/base/LogFile.h"
#include "platform/database/SqlConnection.h"

namespace Kxg
{
namespace
{

const char kColumns[] = "patient_name, referring_physician, description, patient_id, accession_number, study_code";

// Whatever of it fails must leave the transaction around it whole.
bool makePostgresIndex(SqlConnection& connection)
{
    connection.execute(QStringLiteral("SAVEPOINT words_index"));
    try {
        connection.execute(QStringLiteral("CREATE EXTENSION IF NOT EXISTS pg_trgm"));
        QStringList columns;
        for (const QString& column : QString::fromLatin1(kColumns).split(QStringLiteral(", ")))
            columns << column + QStringLiteral(" gin_trgm_ops");
        connection.execute(QStringLiteral("CREATE INDEX study_words_parts ON study_words USING gin (%1)")
                               .arg(columns.join(QStringLiteral(", "))));
        connection.execute(QStringLiteral("RELEASE SAVEPOINT words_index"));
        return true;
    } catch (const DatabaseError& error) {
        connection.execute(QStringLiteral("ROLLBACK TO SAVEPOINT words_index"));
        Kdd::LogFile::warnf("Searches for parts of texts read all of them, for the server has no index for that: %s",
                            error.what());
        return false;
    }
}

}  // namespace

void makeWordsTable(SqlConnection& connection)
{
    if (connection.address().engine == DatabaseAddress::Engine::Sqlite) {
        connection.execute(QStringLiteral("CREATE VIRTUAL TABLE study_words USING fts5 (%1,"
                                          " tokenize = 'trigram case_sensitive 1')")
                               .arg(QLatin1String(kColumns)));
        return;
    }
    QString columns = QString::fromLatin1(kColumns);
    columns.replace(QLatin1String(", "), QLatin1String(" TEXT COLLATE \"C\" NOT NULL, "));
    connection.execute(QStringLiteral("CREATE TABLE study_words (study_id BIGINT NOT NULL PRIMARY KEY,"
                                      " %1 TEXT COLLATE \"C\" NOT NULL)")
                           .arg(columns));
    makePostgresIndex(connection);
}

bool obtainWordsIndex(SqlConnection& connection)
{
    if (connection.address().engine == DatabaseAddress::Engine::Sqlite)
        return true;
    {
        SqlRows rows = connection.ask("SELECT 1 FROM pg_indexes WHERE indexname = 'study_words_parts'"
                                      " AND schemaname = current_schema()");
        if (rows.next())
            return true;
    }
    return makePostgresIndex(connection);
}

}  // namespace Kxg
