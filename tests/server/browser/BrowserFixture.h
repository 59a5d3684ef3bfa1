#pragma once

#include "server/browser/BrowserService.h"
#include "support/DatasetBuilder.h"
#include "support/TemporaryStore.h"

#include <QJsonArray>
#include <QJsonDocument>

#include <gtest/gtest.h>
#include <kddlib/TagFile.h>
#include <kddlib/TagMap.h>

namespace Kdd::Browser
{

/// A store of one study, and the browser over it.
class BrowserTest : public testing::Test
{
protected:
    static void write(const QVector<DatasetBuilder>& images, const char* path = nullptr)
    {
        TagFile file;
        for (const DatasetBuilder& image : images)
            ASSERT_NE(file.addTagMap(image.map(), path, true), nullptr);
        file.optimizeAll();
        ASSERT_TRUE(file.writeCacheFile());
    }

    Http::Response get(const QByteArray& target, const QVector<Http::Field>& headers = {},
                       Http::Method method = Http::Method::Get)
    {
        Http::Request request;
        request.method = method;
        request.headers = headers;
        const QList<QByteArray> parts = target.split('?');
        for (const QByteArray& segment : parts[0].split('/'))
            if (!segment.isEmpty())
                request.path.append(segment);
        for (const QByteArray& one : parts.value(1).split('&'))
            request.query.append({one.split('=').value(0), one.split('=').value(1)});
        return mService.answer(request);
    }

    static QByteArray bodyOf(const Http::Response& response)
    {
        return response.body.empty() ? QByteArray() : std::get<QByteArray>(response.body[0]);
    }

    static QByteArray header(const Http::Response& response, const QByteArray& name)
    {
        for (const Http::Field& field : response.headers)
            if (field.name == name)
                return field.value;
        return {};
    }

    QJsonObject json(const QByteArray& target)
    {
        const Http::Response response = get(target);
        EXPECT_EQ(response.status, 200) << target.constData() << ": " << bodyOf(response).constData();
        return QJsonDocument::fromJson(bodyOf(response)).object();
    }

    /// The entry of the tag among attributes, differences or changes.
    static QJsonObject entry(const QJsonValue& list, const char* tag)
    {
        for (const QJsonValue& one : list.toArray())
            if (one[QStringLiteral("tag")] == QLatin1String(tag))
                return one.toObject();
        return {};
    }

    static std::string text(const QJsonObject& object, const char* name)
    {
        return object[QLatin1String(name)].toString().toStdString();
    }

    TemporaryStore mStore;
    DicomWeb::StudyShelf mShelf{1 << 30};
    BrowserService mService{mShelf, {"pacs/dicom-web", true, false, true, {}}};
};

}  // namespace Kdd::Browser
