#pragma once

#include "server/Handled.h"
#include "server/ServerFixture.h"
#include "server/dicomweb/search/ChangeFeed.h"
#include "server/dicomweb/search/SearchResource.h"
#include "support/CorrectionJob.h"
#include "support/Engines.h"
#include "support/FileContent.h"
#include "support/Json.h"

#include <QTemporaryDir>

#include <kddlib/TagFile.h>

namespace Kdd::DicomWeb
{

/// An archive that the tool makes and changes, and searches over it.
class SearchedArchive : public testing::TestWithParam<Engine>
{
protected:
    void SetUp() override
    {
        mAddress = newDatabase(GetParam(), path("kdd.sqlite"));
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
    void kdd(const QByteArray& arguments) const
    {
        EXPECT_EQ(runTool(path("store"), mAddress, words(arguments)), 0) << arguments.constData();
    }
    void add() const { kdd("add " + path("images").toUtf8()); }

    /// Gives an attribute of an image a new value; with `oldStudy` the image comes from there.
    void correct(const QByteArray& study, const QByteArray& image, const DcmTagKey& key,
                 const QByteArray& value, const QByteArray& oldStudy = {}) const
    {
        putFile(path("job.xml"), jobXml(key, value, oldStudy));
        kdd("qa " + path("job.xml").toUtf8() + " --study " + study + " --image " + image);
    }

    /// "studies?PatientName=*x*", as it stands in an address.
    Http::Response get(const QByteArray& target, const Headers& headers = {})
    {
        Http::Request request = requestFor(target, headers);
        request.base = "http://host/dicom-web";
        ResourcePath resource;
        EXPECT_TRUE(ResourcePath::parse(request.path, resource));
        SearchResource search(*mDatabase, mShelf);
        ChangeFeed feed(*mDatabase);
        return search.owns(resource) ? search.answer(request, resource) : feed.answer(request, resource);
    }

    QJsonArray list(const QByteArray& target)
    {
        const Http::Response response = get(target);
        EXPECT_EQ(response.status, 200) << target.toStdString() << ": " << bodyOf(response).toStdString();
        QJsonParseError error = {};
        const QJsonDocument json = QJsonDocument::fromJson(bodyOf(response), &error);
        EXPECT_EQ(error.error, QJsonParseError::NoError) << bodyOf(response).toStdString();
        return json.array();
    }

    /// The first value of an attribute of each object, separated by blanks.
    std::string values(const QByteArray& target, const char* key)
    {
        QStringList texts;
        for (const QJsonValue& object : list(target))
            texts << textOf(object, key);
        return texts.join(QLatin1Char(' ')).toStdString();
    }

    static QString textOf(const QJsonValue& object, const char* key)
    {
        const QJsonValue value = jsonAt(object, key + QByteArray("/Value/0"));
        return (value.isObject() ? jsonAt(value, "Alphabetic") : value).toVariant().toString();
    }

    std::string studies(const QByteArray& query) { return values("studies?" + query, "0020000D"); }

    const QByteArray& address() const { return mAddress; }
    StudyShelf& shelf() { return mShelf; }

private:
    QTemporaryDir mFolder;
    QByteArray mAddress;
    std::unique_ptr<ThreadSearch> mDatabase;
    StudyShelf mShelf{1 << 28};
};

}  // namespace Kdd::DicomWeb
