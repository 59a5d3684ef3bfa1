#pragma once

#include "server/ServerFixture.h"
#include "server/dicomweb/search/ChangeFeed.h"
#include "server/dicomweb/search/SearchResource.h"
#include "support/FileContent.h"
#include "support/PostgresServer.h"

#include <QTemporaryDir>

#include <kddlib/TagFile.h>

namespace Kdd::DicomWeb
{

enum class Engine { Sqlite, Postgres };

inline std::string engineName(const testing::TestParamInfo<Engine>& engine)
{
    return engine.param == Engine::Sqlite ? "Sqlite" : "Postgres";
}

/// An archive that the tool makes and changes, and searches over it.
class SearchedArchive : public testing::TestWithParam<Engine>
{
protected:
    void SetUp() override
    {
        mAddress =
            GetParam() == Engine::Sqlite ? "sqlite:" + path("kdd.sqlite").toUtf8() : newPostgresDatabase();
        mDatabase = std::make_unique<ThreadSearch>(mAddress);
        TagFile::setMetaFolder(path("store/meta").toLocal8Bit().constData());
        QDir().mkpath(path("images"));
    }

    QString path(const char* name) const { return mFolder.filePath(QString::fromLatin1(name)); }

    /// Writes an image; images of one study are told apart by their file names.
    void store(const char* name, const DatasetBuilder& image) const
    {
        image.save(path("images/") + QString::fromUtf8(name));
    }

    /// Runs the tool, which has to succeed.
    void kdd(const QStringList& arguments) const
    {
        EXPECT_EQ(runTool(path("store"), mAddress, arguments), 0)
            << arguments.join(QLatin1Char(' ')).toStdString();
    }
    void kdd(const char* arguments) const { kdd(QString::fromLatin1(arguments).split(QLatin1Char(' '))); }
    void add() const { kdd({QStringLiteral("add"), path("images")}); }

    /// Gives an attribute of an image a new value; with `oldStudy` the image comes from there.
    void correct(const char* study, const char* image, const char* oldStudy, const char* key,
                 const char* value) const
    {
        putFile(path("job.xml"), "<Job><Timestamp>20240131120000</Timestamp><Substitutions OldSUID='" +
                                     QByteArray(oldStudy) + "'><Tag " + key + "><Value>" + value +
                                     "</Value></Tag></Substitutions></Job>");
        kdd({QStringLiteral("qa"), path("job.xml"), QStringLiteral("--study"), QString::fromLatin1(study),
             QStringLiteral("--image"), QString::fromLatin1(image)});
    }

    /// "studies?PatientName=*x*", as it stands in an address.
    Http::Response get(const char* target, const QVector<Http::Field>& headers = {})
    {
        const QList<QByteArray> parts = QByteArray(target).split('?');
        Http::Request request;
        request.base = "http://host/dicom-web";
        request.headers = headers;
        for (const QByteArray& segment : parts.front().split('/'))
            request.path.append(segment);
        for (const QByteArray& field : QByteArray(target).mid(parts.front().size() + 1).split('&')) {
            const int equals = field.indexOf('=');
            if (equals > 0)
                request.query.append({QByteArray::fromPercentEncoding(field.left(equals)),
                                      QByteArray::fromPercentEncoding(field.mid(equals + 1))});
        }
        ResourcePath resource;
        EXPECT_TRUE(ResourcePath::parse(request.path, resource));
        SearchResource search(*mDatabase, mShelf);
        ChangeFeed feed(*mDatabase);
        return search.owns(resource) ? search.answer(request, resource) : feed.answer(request, resource);
    }

    static QByteArray bodyOf(const Http::Response& response)
    {
        return response.body.empty() ? QByteArray() : std::get<QByteArray>(response.body.front());
    }

    QJsonArray list(const char* target)
    {
        const Http::Response response = get(target);
        EXPECT_EQ(response.status, 200) << target << ": " << bodyOf(response).toStdString();
        QJsonParseError error = {};
        const QJsonDocument json = QJsonDocument::fromJson(bodyOf(response), &error);
        EXPECT_EQ(error.error, QJsonParseError::NoError) << bodyOf(response).toStdString();
        return json.array();
    }

    /// The first value of an attribute of each object, separated by blanks.
    std::string values(const char* target, const char* key)
    {
        QStringList texts;
        for (const QJsonValue& object : list(target))
            texts << textOf(object.toObject(), key);
        return texts.join(QLatin1Char(' ')).toStdString();
    }

    static QString textOf(const QJsonObject& object, const char* key)
    {
        const QJsonValue value =
            object.value(QLatin1String(key)).toObject().value(QLatin1String("Value")).toArray().first();
        return value.isObject() ? value.toObject().value(QLatin1String("Alphabetic")).toString()
                                : value.toVariant().toString();
    }

    std::string studies(const char* query)
    {
        return values((QByteArray("studies?") + query).constData(), "0020000D");
    }

    const QByteArray& address() const { return mAddress; }
    StudyShelf& shelf() { return mShelf; }

private:
    QTemporaryDir mFolder;
    QByteArray mAddress;
    std::unique_ptr<ThreadSearch> mDatabase;
    StudyShelf mShelf{1 << 28};
};

}  // namespace Kdd::DicomWeb
