#pragma once

#include "platform/database/Catalogue.h"
#include "platform/database/DatabaseAddress.h"
#include "platform/database/Kxg.h"
#include "platform/database/SqlConnection.h"
#include "support/PostgresServer.h"

#include <QTemporaryDir>

#include <gtest/gtest.h>

using Engine = Kxg::DatabaseAddress::Engine;

inline std::string engineName(const testing::TestParamInfo<Engine>& engine)
{
    return engine.param == Engine::Sqlite ? "Sqlite" : "Postgres";
}

inline Kxg::DicomFileRecord dicom(const char* path, const char* study, const char* series,
                                  const char* sop = "1")
{
    Kxg::DicomFileRecord file;
    file.path = path;
    file.studyInstanceUID = study;
    file.seriesInstanceUID = series;
    file.sopInstanceUID = sop;
    return file;
}

/// An empty database of either engine, to which all questions go.
class DatabaseTest : public testing::TestWithParam<Engine>
{
protected:
    using Requests = QMap<QByteArray, qint64>;

    void SetUp() override
    {
        mAddress = GetParam() == Engine::Sqlite ? "sqlite:" + mFolder.path().toUtf8() + "/made/catalogue.db"
                                                : Kdd::newPostgresDatabase();
        Kxg::SetDatabaseServer(mAddress);
    }

    const QByteArray& address() const { return mAddress; }

    std::unique_ptr<Kxg::Catalogue> open() const
    {
        Kdd::Result result;
        auto catalogue = Kxg::Catalogue::open(mAddress, result);
        EXPECT_EQ(result.text().toStdString(), "");
        return catalogue;
    }

    Kxg::Catalogue& catalogue()
    {
        if (!mCatalogue)
            mCatalogue = open();
        return *mCatalogue;
    }

    Requests add(const Kxg::FileRecords& files)
    {
        Requests requests;
        EXPECT_EQ(catalogue().registerFiles(files, requests).text().toStdString(), "");
        return requests;
    }
    Requests correct(const std::vector<Kxg::ImageCorrection>& corrections)
    {
        Requests requests;
        EXPECT_EQ(catalogue().recordCorrections(corrections, requests).text().toStdString(), "");
        return requests;
    }
    Requests add(const std::vector<Kxg::DicomFileRecord>& files)
    {
        return add(Kxg::FileRecords{files, {}, {}});
    }

    /// A line "UID patient modalities series/images/volumes" for each study, with a star when it waits.
    std::string studies()
    {
        std::vector<Kxg::StudySummary> list;
        EXPECT_EQ(catalogue().listStudies(list).text().toStdString(), "");
        QByteArray text;
        for (const auto& study : list)
            text += study.studyInstanceUID + ' ' + study.patientName + ' ' + study.modalities + ' ' +
                    QByteArray::number(study.series) + '/' + QByteArray::number(study.images) + '/' +
                    QByteArray::number(study.volumes) + (study.isWaiting ? "*\n" : "\n");
        return text.toStdString();
    }

    std::unique_ptr<Kxg::StudyClaim> claimNext(const QSet<int>& except = {})
    {
        std::unique_ptr<Kxg::StudyClaim> claim;
        EXPECT_EQ(catalogue().claimNext(except, claim).text().toStdString(), "");
        return claim;
    }

    void execute(const char* sql) const
    {
        Kxg::DatabaseAddress parsed;
        ASSERT_TRUE(Kxg::DatabaseAddress::parse(mAddress, parsed).good());
        Kxg::SqlConnection(parsed, Kxg::SqlConnection::IfAbsent::Create).execute(QString::fromUtf8(sql));
    }

private:
    QTemporaryDir mFolder;
    QByteArray mAddress;
    std::unique_ptr<Kxg::Catalogue> mCatalogue;
};
