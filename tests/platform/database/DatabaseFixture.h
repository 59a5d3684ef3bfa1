#pragma once

#include "platform/database/Catalogue.h"
#include "platform/database/DatabaseAddress.h"
#include "platform/database/Kxg.h"
#include "platform/database/SqlConnection.h"
#include "support/Engines.h"

#include <QTemporaryDir>

#include <gtest/gtest.h>

using Kdd::Engine;
using Kdd::engineName;
using Kdd::kBothEngines;

inline Kxg::DicomFileRecord dicom(const QByteArray& path, const QByteArray& study, const QByteArray& series,
                                  const QByteArray& sop = "1")
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
        mAddress = Kdd::newDatabase(GetParam(), mFolder.filePath(QStringLiteral("made/catalogue.db")));
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

    Kxg::DatabaseAddress parsedAddress() const
    {
        Kxg::DatabaseAddress parsed;
        EXPECT_TRUE(Kxg::DatabaseAddress::parse(mAddress, parsed).good());
        return parsed;
    }

    void execute(const QByteArray& sql) const
    {
        Kxg::SqlConnection(parsedAddress(), Kxg::SqlConnection::IfAbsent::Create)
            .execute(QString::fromUtf8(sql));
    }
    void execute(std::initializer_list<const char*> statements) const
    {
        for (const char* sql : statements)
            execute(QByteArray(sql));
    }

private:
    QTemporaryDir mFolder;
    QByteArray mAddress;
    std::unique_ptr<Kxg::Catalogue> mCatalogue;
};
