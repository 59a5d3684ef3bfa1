#include "DatabaseFixture.h"
#include "platform/database/StudySearch.h"

using namespace Kxg;

namespace
{

/// The tables as the first release made them, but for what the engines call their types.
const char* const kFirstTables[] = {
    "CREATE TABLE schema_version (version BIGINT NOT NULL)",
    "INSERT INTO schema_version (version) VALUES (1)",
    "CREATE TABLE study (id {id}, uid TEXT NOT NULL UNIQUE, is_described SMALLINT NOT NULL DEFAULT 0,"
    " patient_name TEXT NOT NULL DEFAULT '', patient_id TEXT NOT NULL DEFAULT '',"
    " patient_birth_date TEXT NOT NULL DEFAULT '', patient_sex TEXT NOT NULL DEFAULT '',"
    " study_date TEXT NOT NULL DEFAULT '', study_time TEXT NOT NULL DEFAULT '',"
    " study_description TEXT NOT NULL DEFAULT '', accession_number TEXT NOT NULL DEFAULT '')",
    "CREATE TABLE series (id {id}, study_id BIGINT NOT NULL REFERENCES study (id), uid TEXT NOT NULL,"
    " is_described SMALLINT NOT NULL DEFAULT 0, series_number TEXT NOT NULL DEFAULT '',"
    " series_description TEXT NOT NULL DEFAULT '', modality TEXT NOT NULL DEFAULT '',"
    " series_date TEXT NOT NULL DEFAULT '', series_time TEXT NOT NULL DEFAULT '',"
    " station_name TEXT NOT NULL DEFAULT '', UNIQUE (study_id, uid))",
    "CREATE TABLE file (path {bytes} NOT NULL PRIMARY KEY, size BIGINT NOT NULL, modified BIGINT NOT NULL,"
    " kind SMALLINT NOT NULL, series_id BIGINT REFERENCES series (id), sop_uid TEXT NOT NULL)",
    "CREATE INDEX file_of_series ON file (series_id)",
    "CREATE TABLE build_request (id {id}, study_id BIGINT NOT NULL REFERENCES study (id) ON DELETE CASCADE)",
    "CREATE INDEX build_request_of_study ON build_request (study_id)",
    "CREATE TABLE config (section TEXT NOT NULL, name TEXT NOT NULL, value {bytes} NOT NULL,"
    " PRIMARY KEY (section, name))",
    "INSERT INTO study (uid, is_described, patient_name) VALUES ('1', 1, 'Doe')",
    "INSERT INTO series (study_id, uid, modality) VALUES (1, '1.1', 'CT')",
    "INSERT INTO file VALUES (CAST('/d/a' AS {bytes}), 5, 7, 1, 1, 'x'), (CAST('/d/b' AS {bytes}), 5, 7, 1, "
    "1, 'x'),"
    " (CAST('/d/c' AS {bytes}), 5, 7, 1, 1, ''), (CAST('/d/d' AS {bytes}), 5, 7, 1, 1, ''),"
    " (CAST('/d/v' AS {bytes}), 5, 7, 2, 1, ''), (CAST('/d/o' AS {bytes}), 5, 7, 0, NULL, '')",
    "INSERT INTO build_request (study_id) VALUES (1)",
};

class MigrationTest : public DatabaseTest
{
protected:
    /// Back to the schema before files were known by digests.
    void forgetProofs() const
    {
        execute({"DROP TABLE former_tag_file", "DROP INDEX study_by_check", "DROP INDEX study_with_faults",
                 "ALTER TABLE study DROP COLUMN checked", "ALTER TABLE study DROP COLUMN check_faults",
                 "ALTER TABLE study DROP COLUMN check_position", "ALTER TABLE file DROP COLUMN digest"});
    }

    /// And to that before searches.
    void forgetSearches() const
    {
        forgetProofs();
        execute({"DROP TABLE forgotten_file", "DROP TABLE change", "DROP TABLE series_request",
                 "DROP TABLE series_search", "DROP TABLE study_modality", "DROP TABLE IF EXISTS study_parts",
                 "DROP TABLE study_words", "DROP TABLE study_answer", "DROP TABLE study_search",
                 "ALTER TABLE build_request DROP COLUMN adds",
                 "ALTER TABLE build_request DROP COLUMN since"});
    }

    void makeFirstTables() const
    {
        const bool isSqlite = GetParam() == Engine::Sqlite;
        for (const char* statement : kFirstTables) {
            QString sql = QString::fromLatin1(statement);
            sql.replace(QLatin1String("{id}"),
                        isSqlite ? QStringLiteral("INTEGER PRIMARY KEY AUTOINCREMENT")
                                 : QStringLiteral("BIGINT GENERATED ALWAYS AS IDENTITY PRIMARY KEY"));
            sql.replace(QLatin1String("{bytes}"),
                        isSqlite ? QStringLiteral("BLOB") : QStringLiteral("BYTEA"));
            execute(sql.toUtf8());
        }
    }
};

INSTANTIATE_TEST_SUITE_P(Engines, MigrationTest, kBothEngines, engineName);

TEST_P(MigrationTest, ADatabaseOfTheFirstReleaseKeepsAllThatItKnows)
{
    makeFirstTables();
    EXPECT_EQ(studies(), "1 Doe CT 1/3/1*\n");
    StudyContents contents;
    ASSERT_TRUE(catalogue().studyContents("1", contents).good());
    QByteArray paths;
    for (const ListedImage& image : contents.images)
        paths += image.path + ' ';
    EXPECT_EQ(paths, "/d/b /d/c /d/d ");  // of two files of one image the last by path, as before
    EXPECT_TRUE(contents.tagFile == TagFileStamp());
    add({dicom("/d/0", "1", "1.1", "x")});
    ASSERT_TRUE(catalogue().studyContents("1", contents).good());
    EXPECT_EQ(contents.images.front().path, "/d/0");
    QHash<QByteArray, FileStamp> known;
    ASSERT_TRUE(catalogue().knownFiles("/d", known).good());
    EXPECT_EQ(known.size(), 7);
}

TEST_P(MigrationTest, ADatabaseOfTheSecondSchemaKnowsWhichFilesACorrectionMoved)
{
    add({dicom("/d/a", "1", "1.1", "x"), dicom("/d/b", "1", "1.1", "")});
    correct({{"1", "x", "2", "2.1", "y", "changes"}, {"1", "/d/b", "2", "2.1", "/d/b", "changes"}});
    forgetSearches();
    execute({"DROP INDEX file_of_correction", "ALTER TABLE file DROP COLUMN correction_id",
             "UPDATE schema_version SET version = 2"});
    open();  // and bring it up to date
    correct({{"1", "x", "1", "1.1", "x", ""}, {"1", "/d/b", "1", "1.1", "/d/b", ""}});
    EXPECT_EQ(studies(), "1   1/2/0*\n");
}

/// Back to the schema before searches, with what it had.
TEST_P(MigrationTest, ADatabaseOfTheThirdSchemaIsFoundBySearchesOnceItIsPrepared)
{
    DicomFileRecord file = dicom("/d/a", "1.2", "1.2.1", "x");
    file.patientName = "Müller^Eva";
    file.modality = "CT";
    add({file});
    forgetSearches();
    execute("UPDATE schema_version SET version = 3");
    Kdd::Result result;
    const auto search = StudySearch::open(address(), result);
    ASSERT_EQ(result.text().toStdString(), "");
    std::vector<FoundStudy> found;
    ASSERT_TRUE(search->studies({}, found).good());
    EXPECT_EQ(found.size(), 0u);
    ASSERT_EQ(search->prepare().text().toStdString(), "");
    ASSERT_TRUE(search->studies({}, found).good());
    ASSERT_EQ(found.size(), 1u);
    EXPECT_EQ(found[0].modalities, "CT");
    EXPECT_TRUE(found[0].attributes.contains("Müller^Eva")) << found[0].attributes.toStdString();
}

TEST_P(MigrationTest, AProgramThatRunsOnNeitherWritesNorReadsTablesItDoesNotKnow)
{
    add({dicom("/d/a", "1", "1.1", "x")});
    std::shared_ptr<DicomDirectoryEntry> study;
    ASSERT_TRUE(GetStudy("1", study).good());
    execute("UPDATE schema_version SET version = version + 1");
    Requests requests;
    std::unique_ptr<StudyClaim> claim;
    const Kxg::FileRecords files{{dicom("/d/b", "1", "1.1", "y")}, {}, {}};
    for (const Kdd::Result& result :
         {catalogue().registerFiles(files, requests), GetStudy("1", study), catalogue().claimNext({}, claim)})
        EXPECT_TRUE(result.text().contains(QLatin1String("this program works with version")))
            << qPrintable(result.text());
    execute("UPDATE schema_version SET version = version - 1");
    EXPECT_EQ(studies(), "1   1/1/0*\n");
    EXPECT_TRUE(GetStudy("1", study).good());
}

/// With a name that no index of a server would take.
TEST_P(MigrationTest, ADatabaseOfTheFifthSchemaGetsTheIndexesOfNames)
{
    DicomFileRecord file = dicom("/d/a", "1.2", "1.2.1", "x");
    file.patientName = "Doe^John";
    file.modality = "CT";
    add({file});
    QByteArray name;
    for (quint32 i = 1; name.size() < 8000; i = i * 1664525 + 1013904223)
        name += QByteArray::number(i, 36);
    forgetProofs();
    execute({"DROP INDEX study_search_by_date",
             "CREATE INDEX study_search_by_date ON study_search (study_date DESC, study_time DESC, uid)",
             "DROP INDEX study_modality_by_date", "ALTER TABLE study_modality DROP COLUMN name_words",
             "ALTER TABLE study_modality DROP COLUMN marks", "ALTER TABLE study_search DROP COLUMN marks",
             "CREATE INDEX study_modality_by_date ON study_modality (modality, study_date DESC)"});
    execute("UPDATE study_search SET name_words = '" + name + "'");
    if (GetParam() == Engine::Postgres)
        execute("ALTER TABLE study_search ALTER COLUMN name_words SET STATISTICS -1");
    execute("UPDATE schema_version SET version = 5");
    open();
    SqlConnection connection(parsedAddress(), SqlConnection::IfAbsent::Fail);
    const auto number = [&](const char* question) {
        SqlRows rows = connection.askOnce(question, {});
        return rows.next() ? rows.number(0) : -1;
    };
    for (const char* table : {"study_search", "study_modality"}) {
        const QByteArray found =
            GetParam() == Engine::Postgres
                ? QByteArray("SELECT attstattarget FROM pg_attribute WHERE attname = 'name_words'"
                             " AND attrelid = '") +
                      table + "'::regclass"
                : QByteArray("SELECT 1000 FROM pragma_index_info('") + table +
                      "_by_date') WHERE name = 'name_words'";
        EXPECT_EQ(number(found.constData()), 1000) << table;
    }
    EXPECT_EQ(number("SELECT LENGTH(m.name_words) FROM study_modality m JOIN study_search s"
                     " ON s.study_id = m.study_id WHERE m.modality = 'CT'"
                     " AND m.name_words = s.name_words AND m.uid = '1.2'"),
              1000);
}

}  // namespace
