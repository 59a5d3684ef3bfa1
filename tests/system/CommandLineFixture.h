#pragma once

#include "support/CorrectionJob.h"
#include "support/DatasetBuilder.h"
#include "support/FileContent.h"
#include "support/Json.h"

#include <QDir>
#include <QProcess>

#include <memory>

namespace Kdd
{

constexpr int kTimeout = 120000;  // [ms]

struct Answer
{
    int exitCode = -1;
    QByteArray out;
    QByteArray err;

    QJsonValue json(const char* place) const { return jsonAt(out, place); }
    int number(const char* key) const { return json(key).toInt(-1); }
};

/// A store and a folder of images of their own, and the tool that works on them.
class CommandLine : public testing::Test
{
protected:
    QString path(const char* name) const { return mFolder.filePath(QString::fromLatin1(name)); }
    QString images() const { return path("images"); }
    QString file(const char* name) const { return images() + QLatin1Char('/') + QString::fromUtf8(name); }

    /// Arguments are separated by blanks, "@NAME" is a file of the folder of images and "@" that itself; `more` follows.
    std::unique_ptr<QProcess> start(const QByteArray& arguments, const QStringList& more = {}) const
    {
        auto process = std::make_unique<QProcess>();
        process->setProgram(QStringLiteral(KDD_BINARY));
        QStringList words{QStringLiteral("--store"), path("store")};
        for (const QByteArray& word : arguments.split(' ')) {
            if (word.startsWith('@'))
                words.append(word.size() == 1 ? images() : file(word.constData() + 1));
            else if (!word.isEmpty())
                words.append(QString::fromLatin1(word));
        }
        process->setArguments(words + more);
        process->start();
        return process;
    }

    static Answer finish(QProcess& process)
    {
        EXPECT_TRUE(process.waitForFinished(kTimeout)) << process.errorString().toStdString();
        EXPECT_EQ(process.exitStatus(), QProcess::NormalExit);
        const Answer answer = {process.exitCode(), process.readAllStandardOutput(),
                               process.readAllStandardError()};
        // Now and then the search for leaks ends by a fault of its own, and says so without the colon of a finding.
        EXPECT_FALSE(answer.err.contains("Sanitizer: ") || answer.err.contains("runtime error"))
            << answer.err.toStdString();
        return answer;
    }

    /// What a server tells of itself once it has begun.
    static QByteArray toldBy(QProcess& server)
    {
        EXPECT_TRUE(server.waitForReadyRead(kTimeout)) << server.readAllStandardError().toStdString();
        return server.readLine();
    }

    Answer kdd(const QByteArray& arguments, const QStringList& more = {}) const
    {
        return finish(*start(arguments, more));
    }

    Answer addImages() const { return kdd("add --json @"); }

    int imagesOf(const QByteArray& study) const { return kdd("stat --json " + study).number("images"); }

    void put(const char* name, const QByteArray& content) const { putFile(file(name), content); }

    void save(const char* name, const DatasetBuilder& image) const
    {
        QDir().mkpath(images());
        image.save(file(name));
    }

    QByteArray bytes(const char* name) const { return fileContent(file(name)); }

    /// The file of a correction's job.
    QByteArray job(const DcmTagKey& key, const QByteArray& value, const QByteArray& oldStudy = {}) const
    {
        putFile(path("job.xml"), jobXml(key, value, oldStudy));
        return path("job.xml").toUtf8();
    }

    /// Two series of study 1.2 with images 1 and 2, 3; study 1.3 with image 4.
    void addTwoStudies() const
    {
        save("1", anImage("1").with("PatientName=Doe^J").withLong(DCM_TextValue, 3000));
        save("2", anImage("2").inSeries("1.2.4").with("PatientName=Doe^J"));
        save("3", anImage("3").inSeries("1.2.4").with("PatientName=Doe^J|Modality=MR"));
        save("4", anImage("4").inStudy("1.3").inSeries("1.3.1"));
        const Answer added = addImages();
        EXPECT_EQ(added.exitCode, 0);
        EXPECT_EQ(added.out, "{\"failed\":0,\"images\":4,\"series\":3,\"skipped\":0,\"studies\":2,"
                             "\"unchanged\":0,\"volumes\":0}\n");
    }

    /// The UIDs that `list` names, in order and separated by blanks.
    std::string listed(const QByteArray& arguments = QByteArray()) const
    {
        QStringList uids;
        for (const QJsonValue& study : kdd("list --json " + arguments).json("studies").toArray())
            uids.append(jsonAt(study, "study").toString());
        uids.sort();
        return uids.join(QLatin1Char(' ')).toStdString();
    }

    QTemporaryDir mFolder;
};

}  // namespace Kdd
