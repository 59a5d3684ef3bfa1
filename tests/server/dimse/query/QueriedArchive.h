#pragma once

#include "server/ServerFixture.h"
#include "server/dicomweb/search/SearchedArchive.h"
#include "server/dimse/RawCaller.h"
#include "support/FileContent.h"

namespace Kdd
{

/// An archive that answers associations, and DCMTK's tools that ask it. "SELF" is where the tools take objects.
class QueriedArchive : public DicomWeb::SearchedArchive
{
protected:
    void SetUp() override
    {
        SearchedArchive::SetUp();
        Kxg::SetDatabaseServer(address());
        takeObjects(mSettings, path("objects"));
        takeAssociations(mSettings);
        mSelf = freePort();
        mSettings.dimse->rules.peers.insert("SELF", {{}, "127.0.0.1", mSelf, false, Dimse::kAllRights});
        mSettings.dimse->rules.peers.insert("NOBODY",
                                            {{}, "127.0.0.1", freePort(), false, Dimse::kAllRights});
        mSettings.dimse->rules.peers.insert("UNCALLED", {{}, {}, 0, false, Dimse::kAllRights});
    }

    void start()
    {
        mServer.reset();
        mServer = started(mSettings);
    }

    quint16 port() const { return dicomPort(*mServer); }

    /// Two images of one series and one of another, of one patient, and one of another patient.
    void fill()
    {
        store("a",
              anImage("1.1.1").inStudy("1").inSeries("1.1").with(DCM_PatientID, "P1").words({1, 2, 3, 4}));
        store("b",
              anImage("1.1.2").inStudy("1").inSeries("1.1").with(DCM_PatientID, "P1").words({5, 6, 7, 8}));
        store("c", anImage("1.2.1").inStudy("1").inSeries("1.2").with(DCM_PatientID, "P1"));
        store("d", anImage("2.1.1").inStudy("2").inSeries("2.1").with(DCM_PatientID, "P2"));
        add();
        start();
    }

    std::string getStudy(const char* uid, const QStringList& more = {})
    {
        return get({QStringLiteral("QueryRetrieveLevel=STUDY"),
                    QStringLiteral("StudyInstanceUID=") + QLatin1String(uid)},
                   more);
    }

    std::string moveStudy(const char* uid, const QStringList& more = {}, const char* to = "SELF")
    {
        return move({QStringLiteral("QueryRetrieveLevel=STUDY"),
                     QStringLiteral("StudyInstanceUID=") + QLatin1String(uid)},
                    more, to);
    }

    /// Starts a tool; `keys` as "PatientName=D*".
    std::unique_ptr<QProcess> begin(const char* tool, const QStringList& options, const QStringList& keys,
                                    const QStringList& files = {})
    {
        mAnswers = path("answers") + QString::number(++mRuns);
        QDir().mkpath(mAnswers);
        QStringList arguments = {QStringLiteral("-v"), QStringLiteral("-od"), mAnswers};
        arguments += options;
        for (const QString& key : keys)
            arguments << QStringLiteral("-k") << key;
        arguments << QStringLiteral("127.0.0.1") << QString::number(port());
        arguments += files;
        auto process = std::make_unique<QProcess>();
        process->setWorkingDirectory(mAnswers);
        process->setProcessChannelMode(QProcess::MergedChannels);
        process->start(QLatin1String(tool), arguments);
        return process;
    }

    std::string run(const char* tool, const QStringList& options, const QStringList& keys)
    {
        const std::unique_ptr<QProcess> process = begin(tool, options, keys);
        EXPECT_TRUE(process->waitForFinished(120000)) << tool << process->errorString().toStdString();
        return process->readAll().toStdString();
    }

    std::string find(const QStringList& keys, const char* root = "-S")
    {
        return run("findscu", {QLatin1String(root), QStringLiteral("-X")}, keys);
    }

    std::string move(const QStringList& keys, const QStringList& more = {}, const char* to = "SELF")
    {
        return run("movescu",
                   QStringList{QStringLiteral("-S"), QStringLiteral("-aem"), QLatin1String(to),
                               QStringLiteral("+P"), QString::number(mSelf)} +
                       more,
                   keys);
    }

    std::string get(const QStringList& keys, const QStringList& more = {})
    {
        return run("getscu", QStringList{QStringLiteral("-S")} + more, keys);
    }

    using SearchedArchive::get;

    /// The dataset of an object as it is retrieved over HTTP, as stored.
    QByteArray retrieved(const char* path) const
    {
        return datasetOf(ask(*mServer, "GET", QByteArray("/dicom-web/") + path,
                             "Accept: application/dicom; transfer-syntax=*\r\n")
                             .body);
    }

    /// The datasets of the objects that the last run left, as they came.
    std::vector<QByteArray> takenDatasets() const
    {
        std::vector<QByteArray> datasets;
        const QDir folder(mAnswers);
        for (const QString& name : folder.entryList(QDir::Files, QDir::Name))
            datasets.push_back(datasetOf(fileContent(folder.filePath(name))));
        return datasets;
    }

    /// What the last run left, in the order of the names of its files.
    std::vector<DcmFileFormat> answers() const
    {
        std::vector<DcmFileFormat> files;
        const QDir folder(mAnswers);
        for (const QString& name : folder.entryList(QDir::Files, QDir::Name)) {
            files.emplace_back();
            EXPECT_TRUE(files.back().loadFile(folder.filePath(name).toUtf8().constData()).good());
        }
        return files;
    }

    /// Of those an attribute, sorted and separated by blanks.
    std::string answered(const DcmTagKey& key) const
    {
        QStringList values;
        for (DcmFileFormat& file : answers())
            values << QString::fromStdString(text(file, key));
        values.sort();
        return values.join(QLatin1Char(' ')).toStdString();
    }

    static std::string text(DcmFileFormat& file, const DcmTagKey& key)
    {
        OFString value;
        return file.getDataset()->findAndGetOFStringArray(key, value).good() ? std::string(value.c_str())
                                                                             : "-";
    }

    LogCapture mLog;
    ServerSettings mSettings = onFreePort();
    quint16 mSelf = 0;
    QString mAnswers;
    std::unique_ptr<Server> mServer;

private:
    int mRuns = 0;
};

/// "STUDY" and the keys that ask on that level.
inline QStringList onLevel(const char* level, QStringList keys)
{
    keys.prepend(QStringLiteral("QueryRetrieveLevel=") + QLatin1String(level));
    return keys;
}

/// Separated by "|".
inline QStringList keysOf(const char* keys)
{
    return QString::fromUtf8(keys).split(QLatin1Char('|'));
}

}  // namespace Kdd
