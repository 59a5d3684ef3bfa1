#pragma once

#include "server/Handled.h"
#include "server/browser/BrowserService.h"
#include "support/DatasetBuilder.h"
#include "support/Json.h"
#include "support/TemporaryStore.h"

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

    Http::Response get(const QByteArray& target, const Headers& headers = {},
                       Http::Method method = Http::Method::Get)
    {
        return mService.answer(requestFor(target, headers, method));
    }

    QJsonValue json(const QByteArray& target, const QByteArray& place = {})
    {
        const Http::Response response = get(target);
        EXPECT_EQ(response.status, 200) << target.constData() << ": " << bodyOf(response).constData();
        return jsonAt(bodyOf(response), place);
    }

    /// What is told of the study, its "/corrections" for example.
    QJsonValue told(const QByteArray& below, const QByteArray& place)
    {
        return json("/browser/studies/1.2" + below, place);
    }
    std::string text(const QByteArray& below, const QByteArray& place)
    {
        return told(below, place).toString().toStdString();
    }

    /// The entry of the tag among attributes, differences or changes.
    static QJsonValue entry(const QJsonValue& list, const char* tag)
    {
        for (const QJsonValue& one : list.toArray())
            if (jsonAt(one, "tag") == QLatin1String(tag))
                return one;
        return QJsonValue::Undefined;
    }
    QJsonValue attribute(const QByteArray& image, const char* tag)
    {
        return entry(told("/images/" + image + "/attributes", "attributes"), tag);
    }

    TemporaryStore mStore;
    DicomWeb::StudyShelf mShelf{1 << 30};
    BrowserService mService{mShelf, {"pacs/dicom-web", true, false, true, {}}};
};

}  // namespace Kdd::Browser
