#pragma once

#include "server/ServerFixture.h"
#include "support/FileContent.h"
#include "support/Json.h"

#include <kddlib/TagFile.h>

namespace Kdd
{

const QByteArray kRenamed = R"({"tags":[{"tag":"00100010","value":"Roe^Jane"}]})";

/// A server that takes objects and corrections, and deletes, over a store of its own.
class ChangedArchive : public ServerFixture
{
protected:
    explicit ChangedArchive(const QByteArray& database = {})
        : ServerFixture(database)
    {
        takeObjects();
        mSettings.changes.corrections = true;
        mSettings.changes.deletions = true;
    }

    Reply ask(const QByteArray& method, const QByteArray& path, const QByteArray& type = {},
              const QByteArray& body = {}, const QByteArray& headers = {}) const
    {
        return ServerFixture::ask(
            method, path, (type.isEmpty() ? QByteArray() : "Content-Type: " + type + "\r\n") + headers, body);
    }
    Reply remove(const QByteArray& path) const { return ask("DELETE", "/dicom-web" + path); }

    /// A job in JSON, of a study; `query` begins with "?".
    Reply correct(const QByteArray& study, const QByteArray& query, const QByteArray& job,
                  const QByteArray& headers = {}) const
    {
        return ask("POST", "/dicom-web/studies/" + study + "/corrections" + query, "application/json", job,
                   headers);
    }

    /// Sends an image; its path below that of DICOMweb, where it is told to be.
    void store(const DatasetBuilder& image) const
    {
        EXPECT_EQ(ask("POST", "/dicom-web/studies", "application/dicom", image.file()).status, 200);
    }

    /// Two images in series 1.2.3, one in 1.2.4, all of study 1.2.
    void storeStudy() const
    {
        for (const char* uid : {"1.2.3.1", "1.2.3.2"})
            store(anImage(uid).with("PatientName=Doe^John|PatientID=7"));
        store(anImage("1.2.4.1").inSeries("1.2.4").with(DCM_PatientName, "Doe^John"));
    }

    /// The values of an attribute of all images of a study, by UID, separated by blanks.
    std::string values(const QByteArray& study, const char* key) const
    {
        QMap<QString, QString> texts;
        for (const QJsonValue image : jsonAt(get("/studies/" + study + "/metadata").body).toArray()) {
            const QJsonValue value = jsonAt(image, key + QByteArray("/Value/0"));
            texts.insert(jsonAt(image, "00080018/Value/0").toString(),
                         (value.isObject() ? jsonAt(value, "Alphabetic") : value).toVariant().toString());
        }
        return QStringList(texts.values()).join(QLatin1Char(' ')).toStdString();
    }

    /// "corrected deleted", as the feed of changes tells of a study.
    std::string feed(const QByteArray& study) const
    {
        QStringList kinds;
        for (const QJsonValue change : jsonAt(get("/changefeed").body, "changes").toArray())
            if (jsonAt(change, "study").toString().toLatin1() == study)
                kinds << jsonAt(change, "change").toString();
        return kinds.join(QLatin1Char(' ')).toStdString();
    }
};

}  // namespace Kdd
