#pragma once

#include "server/ServerFixture.h"
#include "server/dicomweb/search/SearchedArchive.h"
#include "server/dimse/RawCaller.h"
#include "support/FileContent.h"

namespace Kdd
{

/// "STUDY" and the keys that ask on that level.
inline QByteArray onLevel(const QByteArray& level, const QByteArray& keys)
{
    return "QueryRetrieveLevel=" + level + '|' + keys;
}

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
        const auto image = [](const char* sop, const char* study, const char* series, const char* patient) {
            return anImage(sop).inStudy(study).inSeries(series).with(DCM_PatientID, patient);
        };
        store("a", image("1.1.1", "1", "1.1", "P1").words({1, 2, 3, 4}));
        store("b", image("1.1.2", "1", "1.1", "P1").words({5, 6, 7, 8}));
        store("c", image("1.2.1", "1", "1.2", "P1"));
        store("d", image("2.1.1", "2", "2.1", "P2"));
        add();
        start();
    }

    /// Starts a tool; keys as "PatientName=D*|PatientID", and files with keys.
    std::unique_ptr<QProcess> begin(const char* tool, const QByteArray& options, const QByteArray& keys,
                                    const QStringList& files = {})
    {
        mAnswers = path("answers") + QString::number(++mRuns);
        QDir().mkpath(mAnswers);
        QStringList arguments = words("-v " + options + " -od " + mAnswers.toUtf8());
        for (const QString& key : QString::fromUtf8(keys).split(QLatin1Char('|')))
            arguments << QStringLiteral("-k") << key;
        arguments << QStringLiteral("127.0.0.1") << QString::number(port());
        auto process = std::make_unique<QProcess>();
        process->setWorkingDirectory(mAnswers);
        process->setProcessChannelMode(QProcess::MergedChannels);
        process->start(QLatin1String(tool), arguments + files);
        return process;
    }

    std::string run(const char* tool, const QByteArray& options, const QByteArray& keys)
    {
        const std::unique_ptr<QProcess> process = begin(tool, options, keys);
        EXPECT_TRUE(process->waitForFinished(120000)) << tool << process->errorString().toStdString();
        return process->readAll().toStdString();
    }

    std::string find(const QByteArray& keys, const QByteArray& options = "-S")
    {
        return run("findscu", options + " -X", keys);
    }

    std::string get(const QByteArray& keys, const QByteArray& options = {})
    {
        return run("getscu", "-S " + options, keys);
    }

    /// To "SELF" it takes the objects itself.
    QByteArray moving(const QByteArray& to) const
    {
        return "-S -aem " + to + " +P " + QByteArray::number(mSelf) + ' ';
    }
    std::string move(const QByteArray& keys, const QByteArray& options = {}, const QByteArray& to = "SELF")
    {
        return run("movescu", moving(to) + options, keys);
    }

    std::string getStudy(const QByteArray& uid, const QByteArray& options = {})
    {
        return get(onLevel("STUDY", "StudyInstanceUID=" + uid), options);
    }
    std::string moveStudy(const QByteArray& uid, const QByteArray& options = {},
                          const QByteArray& to = "SELF")
    {
        return move(onLevel("STUDY", "StudyInstanceUID=" + uid), options, to);
    }

    /// The dataset of an object as it is retrieved over HTTP, as stored.
    QByteArray retrieved(const QByteArray& path) const
    {
        const QByteArray accept = "Accept: application/dicom; transfer-syntax=*\r\n";
        return datasetOf(ask(*mServer, "GET", "/dicom-web/" + path, accept).body);
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

}  // namespace Kdd
