#include "platform/database/Schema.h"

#include "platform/database/SearchWords.h"
#include "platform/database/SqlConnection.h"
#include "platform/database/SqlDialect.h"

#include <QThread>

#include <iterator>

namespace Kxg
{
namespace
{

// 30 seconds in all, which is how long writers wait for their turn.
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
        // Read with tolerance, of which something may be left out.
        QStringLiteral("ALTER TABLE file ADD COLUMN is_damaged SMALLINT NOT NULL DEFAULT 0"),
        // Of several files of one image in a study one is shown: the one registered last, which has the greatest number.
        QStringLiteral("CREATE TABLE registration (last BIGINT NOT NULL)"),
        QStringLiteral("INSERT INTO registration (last) VALUES (0)"),
        QStringLiteral("ALTER TABLE file ADD COLUMN registered BIGINT NOT NULL DEFAULT 0"),
        QStringLiteral("ALTER TABLE file ADD COLUMN is_shown SMALLINT NOT NULL DEFAULT 1"),
        QStringLiteral("CREATE INDEX file_of_sop_uid ON file (sop_uid)"),
        // So far it was the last by path.
        QStringLiteral("UPDATE file SET is_shown = 0 WHERE kind = 1 AND sop_uid <> '' AND EXISTS"
                       " (SELECT 1 FROM file later JOIN series ON series.id = later.series_id"
                       " WHERE later.kind = 1 AND later.sop_uid = file.sop_uid AND later.path > file.path"
                       " AND series.study_id = (SELECT study_id FROM series WHERE id = file.series_id))"),
        QStringLiteral("ALTER TABLE study ADD COLUMN tag_file_size BIGINT NOT NULL DEFAULT 0"),
        QStringLiteral("ALTER TABLE study ADD COLUMN tag_file_digest {bytes}"),
        // A request counts from this moment on [ms since 1970].
        QStringLiteral("ALTER TABLE build_request ADD COLUMN due BIGINT NOT NULL DEFAULT 0"),
        // An image is known by its SOP Instance UID, or by its path where it has none; hence bytes.
        QStringLiteral("CREATE TABLE correction (id {id}, study_uid {text} NOT NULL, image {bytes} NOT NULL,"
                       " shown_study_uid {text} NOT NULL, shown_series_uid {text} NOT NULL,"
                       " shown_image {bytes} NOT NULL, changes {bytes} NOT NULL, UNIQUE (study_uid, image))"),
        QStringLiteral("CREATE INDEX correction_of_shown_image ON correction (shown_study_uid, shown_image)"),
        // Series that also have images of a volume file of another series, because a correction moved them.
        QStringLiteral("CREATE TABLE volume_share"
                       " (path {bytes} NOT NULL REFERENCES file (path) ON DELETE CASCADE,"
                       " series_id BIGINT NOT NULL REFERENCES series (id) ON DELETE CASCADE,"
                       " PRIMARY KEY (path, series_id))"),
        QStringLiteral("CREATE INDEX volume_share_of_series ON volume_share (series_id)"),
    },
    {
        // The correction that put a file where it is listed; null: it is where it says itself. Where a moved image has
        // taken over from another of its UID, nothing else tells the files of the two apart.
        QStringLiteral("ALTER TABLE file ADD COLUMN correction_id BIGINT"),
        QStringLiteral(
            "CREATE INDEX file_of_correction ON file (correction_id) WHERE correction_id IS NOT NULL"),
        // So far all of them counted as the moved image's.
        QStringLiteral(
            "UPDATE file SET correction_id = (SELECT MAX(correction.id) FROM series"
            " JOIN study ON study.id = series.study_id"
            " JOIN correction ON correction.shown_study_uid = study.uid WHERE series.id = file.series_id"
            " AND correction.shown_image = CASE WHEN file.sop_uid = '' THEN file.path"
            " ELSE {bytes of file.sop_uid} END) WHERE kind = 1 AND EXISTS (SELECT 1 FROM correction)"),
    },
    {
        // What searches ask for. Rows are narrow, and what answers show stands apart, so that a walk in the order of the
        // dates reads little. The size and time of the tag file that a row was taken from tell whether it still holds.
        QStringLiteral(
            "CREATE TABLE study_search (study_id {key} NOT NULL PRIMARY KEY"
            " REFERENCES study (id) ON DELETE CASCADE, uid {text} NOT NULL,"
            " is_built SMALLINT NOT NULL, file_size BIGINT NOT NULL, file_modified BIGINT NOT NULL,"
            " digest {bytes} NOT NULL, study_date {text} NOT NULL, study_time {text} NOT NULL,"
            " accession_number {text} NOT NULL, patient_id {text} NOT NULL,"
            " patient_birth_date {text} NOT NULL, patient_sex {text} NOT NULL, study_code {text} NOT NULL,"
            " sort_name {text} NOT NULL, name_words {text} NOT NULL, modalities {text} NOT NULL, "
            "series_count BIGINT NOT NULL,"
            " instance_count BIGINT NOT NULL)"),
        QStringLiteral("CREATE INDEX study_search_by_date ON study_search"
                       " (study_date DESC, study_time DESC, uid)"),
        QStringLiteral("CREATE INDEX study_search_by_uid ON study_search (uid)"),
        QStringLiteral("CREATE INDEX study_search_by_name ON study_search"
                       " (sort_name, patient_id, study_date DESC, study_time DESC, uid)"),
        QStringLiteral("CREATE INDEX study_search_by_patient ON study_search"
                       " (patient_id, study_date DESC, study_time DESC, uid)"),
        QStringLiteral("CREATE INDEX study_search_by_accession ON study_search"
                       " (accession_number, study_date DESC, study_time DESC, uid)"),
        QStringLiteral("CREATE INDEX study_search_by_code ON study_search (study_code)"),
        QStringLiteral("CREATE INDEX study_search_by_birth ON study_search (patient_birth_date)"),
        QStringLiteral("CREATE TABLE study_answer (study_id {key} NOT NULL PRIMARY KEY"
                       " REFERENCES study_search (study_id) ON DELETE CASCADE, attributes {bytes} NOT NULL)"),
        QStringLiteral("{words table}"),
        // With the order of the list, so that the first page of a modality is read and no more.
        QStringLiteral("CREATE TABLE study_modality (modality {text} NOT NULL, study_date {text} NOT NULL,"
                       " study_time {text} NOT NULL, uid {text} NOT NULL, study_id BIGINT NOT NULL"
                       " REFERENCES study_search (study_id) ON DELETE CASCADE,"
                       " PRIMARY KEY (study_id, modality))"),
        QStringLiteral("CREATE INDEX study_modality_by_date ON study_modality"
                       " (modality, study_date DESC, study_time DESC, uid, study_id)"),
        QStringLiteral("CREATE TABLE series_search (study_id BIGINT NOT NULL"
                       " REFERENCES study_search (study_id) ON DELETE CASCADE, uid {text} NOT NULL,"
                       " modality {text} NOT NULL, series_number BIGINT NOT NULL,"
                       " number_text {text} NOT NULL, description {text} NOT NULL,"
                       " performed_date {text} NOT NULL, performed_time {text} NOT NULL,"
                       " instance_count BIGINT NOT NULL, attributes {bytes} NOT NULL,"
                       " PRIMARY KEY (study_id, uid))"),
        QStringLiteral("CREATE INDEX series_search_by_uid ON series_search (uid)"),
        QStringLiteral("CREATE INDEX series_search_by_performed ON series_search"
                       " (performed_date, performed_time)"),
        QStringLiteral("CREATE TABLE series_request (study_id BIGINT NOT NULL"
                       " REFERENCES study_search (study_id) ON DELETE CASCADE, uid {text} NOT NULL,"
                       " scheduled_step {text} NOT NULL, requested_procedure {text} NOT NULL)"),
        QStringLiteral("CREATE INDEX series_request_of_series ON series_request (study_id, uid)"),
        QStringLiteral("CREATE INDEX series_request_by_step ON series_request (scheduled_step)"),
        QStringLiteral("CREATE INDEX series_request_by_procedure ON series_request (requested_procedure)"),
        // What happened to studies, in the order in which others could see it.
        QStringLiteral("CREATE TABLE change (position BIGINT NOT NULL PRIMARY KEY, kind SMALLINT NOT NULL,"
                       " study_uid {text} NOT NULL, from_uid {text} NOT NULL, to_uid {text} NOT NULL,"
                       " instance_count BIGINT NOT NULL, at BIGINT NOT NULL)"),
    },
    {
        // Whether a request speaks only of files that were not known before, and since when it is there [ms since 1970].
        // Such files can be merged by anybody, and whoever took them in does that himself if he lives.
        QStringLiteral("ALTER TABLE build_request ADD COLUMN adds SMALLINT NOT NULL DEFAULT 0"),
        QStringLiteral("ALTER TABLE build_request ADD COLUMN since BIGINT NOT NULL DEFAULT 0"),
        // Files that were removed here and are still on the disk: whoever looks for files that an older database does not
        // know must not bring these back.
        QStringLiteral("CREATE TABLE forgotten_file (path {bytes} NOT NULL PRIMARY KEY)"),
    },
    {
        // Names too, so that whoever walks the list for a part of one reads nothing but the index; a server also wants
        // there what is asked for.
        QStringLiteral("DROP INDEX study_search_by_date"),
        QStringLiteral("{bounded names}"),
        QStringLiteral("CREATE INDEX study_search_by_date ON study_search"
                       " (study_date DESC, study_time DESC, uid{also}study_id, name_words)"),
        QStringLiteral("DROP INDEX study_search_by_name"),
        QStringLiteral("CREATE INDEX study_search_by_name ON study_search"
                       " (sort_name, patient_id, study_date DESC, study_time DESC, uid{also}study_id)"),
        QStringLiteral("{finer statistics}"),
    },
    {
        // Names stand in the list of a modality, too: whoever looks for both would look each study up for its name. Made
        // anew, so that the index has no rows of a former table to carry.
        QStringLiteral("ALTER TABLE study_modality RENAME TO former_modality"),
        QStringLiteral("CREATE TABLE study_modality (modality {text} NOT NULL, study_date {text} NOT NULL,"
                       " study_time {text} NOT NULL, uid {text} NOT NULL, study_id BIGINT NOT NULL"
                       " REFERENCES study_search (study_id) ON DELETE CASCADE, name_words {text} NOT NULL,"
                       " PRIMARY KEY (study_id, modality))"),
        QStringLiteral(
            "INSERT INTO study_modality (modality, study_date, study_time, uid, study_id, name_words)"
            " SELECT f.modality, s.study_date, s.study_time, s.uid, s.study_id, s.name_words"
            " FROM former_modality f JOIN study_search s ON s.study_id = f.study_id"),
        QStringLiteral("DROP TABLE former_modality"),
        QStringLiteral("CREATE INDEX study_modality_by_date ON study_modality"
                       " (modality, study_date DESC, study_time DESC, uid{also}study_id, name_words)"),
        QStringLiteral("{names of modalities}"),
    },
    {
        // By what those who may see some studies only find theirs in a list; a star: nobody has looked yet.
        QStringLiteral("ALTER TABLE study_search ADD COLUMN marks {text} NOT NULL DEFAULT '*'"),
        QStringLiteral("ALTER TABLE study_modality ADD COLUMN marks {text} NOT NULL DEFAULT '*'"),
        QStringLiteral("DROP INDEX study_search_by_date"),
        QStringLiteral("CREATE INDEX study_search_by_date ON study_search"
                       " (study_date DESC, study_time DESC, uid{also}study_id, name_words, marks)"),
        QStringLiteral("DROP INDEX study_modality_by_date"),
        QStringLiteral("CREATE INDEX study_modality_by_date ON study_modality"
                       " (modality, study_date DESC, study_time DESC, uid{also}study_id, name_words, marks)"),
    },
    {
        // SHA-256 of all bytes of the file, of the size and time that stand beside it; null: not taken.
        QStringLiteral("ALTER TABLE file ADD COLUMN digest {bytes}"),
        // Tag files that were written before the last one, so that one that comes back is known as old.
        QStringLiteral("CREATE TABLE former_tag_file (id {id}, study_id BIGINT NOT NULL"
                       " REFERENCES study (id) ON DELETE CASCADE, size BIGINT NOT NULL,"
                       " digest {bytes} NOT NULL)"),
        QStringLiteral("CREATE INDEX former_tag_file_of_study ON former_tag_file (study_id, id)"),
        // When all bytes of the study's files were looked at last [ms since 1970], how many of these files were not as
        // they should be, and up to which file the look that is not at its end has come.
        QStringLiteral("ALTER TABLE study ADD COLUMN checked BIGINT NOT NULL DEFAULT 0"),
        QStringLiteral("ALTER TABLE study ADD COLUMN check_faults BIGINT NOT NULL DEFAULT 0"),
        QStringLiteral("ALTER TABLE study ADD COLUMN check_position {bytes}"),
        QStringLiteral("CREATE INDEX study_by_check ON study (checked, id)"),
        QStringLiteral("CREATE INDEX study_with_faults ON study (check_faults) WHERE check_faults > 0"),
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
    // Looked for in the engine's own list: on a server a question to a missing table would spoil the
    // transaction.
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
        statement.replace(QLatin1String("{key}"), dialect.key);
        statement.replace(QLatin1String("{also}"), dialect.alsoInIndex);
        if (statement == QLatin1String("{words table}")) {
            makeWordsTable(connection);
            continue;
        }
        if (statement == QLatin1String("{bounded names}")) {
            boundNames(connection);
            continue;
        }
        if (statement == QLatin1String("{finer statistics}")) {
            refineStatistics(connection, "study_search");
            continue;
        }
        if (statement == QLatin1String("{names of modalities}")) {
            indexModalityNames(connection);
            refineStatistics(connection, "study_modality");
            continue;
        }
        statement.replace(QLatin1String("{bytes of file.sop_uid}"),
                          dialect.bytesOf.arg(QLatin1String("file.sop_uid")));
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
    // All steps in one transaction, so that nobody meets tables that are half changed.
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
    // Nearly always so, and then nobody waits for a turn to write.
    if (version == currentSchemaVersion())
        return connection.holdToSchema(version);
    if (version == 0)
        for (const QString& statement : SqlDialect::of(connection.address().engine).beforeSchema)
            executePatiently(connection, statement);
    // Of a large archive a step may take as long as it does.
    const SqlConnection::Unhurried unhurried(connection);
    connection.transact(SqlConnection::Access::Write, [&] { migrate(connection); });
    connection.holdToSchema(currentSchemaVersion());
}

void requireSchema(SqlConnection& connection)
{
    if (schemaVersion(connection) == 0)
        throw DatabaseError(QStringLiteral("it has no tables of an image database"));
}

void requireCurrentSchema(SqlConnection& connection)
{
    requireSchema(connection);
    const int version = schemaVersion(connection);
    if (version != currentSchemaVersion())
        refuse(version);
    connection.holdToSchema(version);
}

}  // namespace Kxg
