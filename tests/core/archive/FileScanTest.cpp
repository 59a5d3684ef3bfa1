#include "kddlib/archive/FileScan.h"

#include "kddlib/TagFileGenerator.h"
#include "kddlib/archive/StudyIntake.h"
#include "kddlib/tagmodel/TagMap.h"
#include "platform/database/Kxg.h"
#include "support/DatasetBuilder.h"
#include "support/FileContent.h"
#include "support/LogCapture.h"
#include "support/TemporaryStore.h"

#include <QFile>
#include <QSqlDatabase>
#include <QSqlQuery>
#include <QSqlRecord>
#include <QVariant>

#include <gtest/gtest.h>

using namespace Kdd;

namespace
{

/// What came of a scan: all that others see of it.
struct Taken
{
    std::vector<std::string> told;
    std::vector<std::string> paths;  // in the order in which they were handed on
    QStringList rows;
    std::vector<QByteArray> tagFiles;  // as they were merged and as they are built
};

/// A folder with what archives have.
class FileScanTest : public testing::Test
{
protected:
    QString path(int number) const
    {
        return mFolder.filePath(QStringLiteral("f%1").arg(number, 4, 10, QLatin1Char('0')));
    }

    void save(int number, E_TransferSyntax xfer)
    {
        const QByteArray study = "1." + QByteArray::number(1 + number % 3);
        const QByteArray uid = study + ".1." + QByteArray::number(number % 50 == 49 ? 7 : number);
        anImage(uid)
            .inStudy(study)
            .inSeries(study + ".1")
            .with(DCM_PatientName, number % 20 == 0 ? "Roe^R" : "Doe^J")
            .save(path(number), xfer);
    }

    void fillFolder()
    {
        for (int i = 0; i < 200; ++i) {
            if (i % 17 == 3)
                QFile::link(QStringLiteral("gone"), path(i));
            else if (i % 17 == 5)
                putFile(path(i), "no image");
            else
                save(i, i % 17 == 7 ? EXS_BigEndianExplicit : EXS_LittleEndianExplicit);
            if (i % 17 == 9) {
                EXPECT_TRUE(QFile::resize(path(i), QFile(path(i)).size() - 10));
            }
        }
    }

    QStringList rowsOf(const QString& database) const
    {
        QStringList rows;
        {
            QSqlDatabase opened =
                QSqlDatabase::addDatabase(QStringLiteral("QSQLITE"), QStringLiteral("rows"));
            opened.setDatabaseName(database);
            EXPECT_TRUE(opened.open());
            for (const char* question :
                 {"SELECT * FROM file ORDER BY rowid", "SELECT * FROM series ORDER BY id",
                  "SELECT id, uid FROM study ORDER BY id"}) {
                QSqlQuery query(QLatin1String(question), opened);
                while (query.next()) {
                    for (int i = 0; i < query.record().count(); ++i)
                        rows.append(query.value(i).toString());
                }
            }
        }
        QSqlDatabase::removeDatabase(QStringLiteral("rows"));
        return rows;
    }

    Taken take(int readers) const
    {
        const TemporaryStore store;
        const QString database = store.filePath("kdd.sqlite");
        Kxg::SetDatabaseServer("sqlite:" + database.toUtf8());
        Result result;
        const auto catalogue = Kxg::Catalogue::open(Kxg::DatabaseServer(), result);
        const LogCapture log;
        Taken taken;
        WorkObserver nobody;
        FileScan scan(*catalogue, nobody);
        scan.setReaders(readers);
        scan.setNamesSkipped(true);
        StudyIntake intake(*catalogue, nobody);
        EXPECT_TRUE(scan.run({mFolder.path().toUtf8()},
                             [&](DicomInput input) {
                                 taken.paths.push_back(input.path.toStdString());
                                 return intake.take(std::move(input));
                             })
                        .good());
        EXPECT_TRUE(intake.finish().good());
        for (int study = 1; study <= 3; ++study) {
            const QByteArray uid = "1." + QByteArray::number(study);
            const QString place = TagFile::cacheFilePathForStudy(uid);
            taken.tagFiles.push_back(fileContent(place));
            QFile::remove(place);
            std::vector<Kxg::StudySummary> studies;
            EXPECT_TRUE(catalogue->listStudies(studies).good());
            TagFileGenerator generator;
            generator.setReaders(readers);
            TagFile file;
            for (const Kxg::StudySummary& each : studies)
                EXPECT_TRUE(each.studyInstanceUID != uid ||
                            generator.createTagFile(file, each.id, uid.constData()));
            taken.tagFiles.push_back(fileContent(place));
        }
        taken.told = log.lines();
        taken.rows = rowsOf(database);
        Kxg::SetDatabaseServer(QByteArray());
        return taken;
    }

    QTemporaryDir mFolder;
};

TEST_F(FileScanTest, TakesTheSameWithAnyNumberOfReaders)
{
    fillFolder();
    const Taken one = take(1);
    EXPECT_EQ(one.paths.size(), 176U);
    EXPECT_GT(one.told.size(), 24U);
    for (const int readers : {2, 7}) {
        const Taken several = take(readers);
        EXPECT_EQ(several.told, one.told);
        EXPECT_EQ(several.paths, one.paths);
        EXPECT_EQ(several.rows, one.rows);
        EXPECT_TRUE(several.tagFiles == one.tagFiles);
    }
}

}  // namespace
