#include "server/Handled.h"
#include "server/dicomweb/metadata/MetadataResource.h"
#include "support/DatasetBuilder.h"
#include "support/FileContent.h"
#include "support/Gzip.h"
#include "support/Json.h"
#include "support/LogCapture.h"
#include "support/RealFiles.h"
#include "support/Setting.h"
#include "support/TemporaryStore.h"

#include <QDir>
#include <QUrl>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <kddlib/DicomJson.h>
#include <kddlib/LogFile.h>
#include <kddlib/TagMap.h>
#include <sys/stat.h>

#include <functional>
#include <sstream>

using namespace Kdd;
using namespace Kdd::DicomWeb;

namespace
{

/// An answer as a client has it.
struct Received
{
    int status = 0;
    QByteArray body;
    bool wasKept = false;
    QMap<QByteArray, QByteArray> headers;

    QByteArray tag() const { return headers.value("ETag"); }
};

const Headers kGzip = {{"accept-encoding", "gzip, br"}};

class MetadataTest : public testing::Test
{
protected:
    /// Study 1.2 with two series of `count` images each.
    static void write(int count = 6)
    {
        TagFile file;
        for (int i = 0; i < 2 * count; ++i) {
            DatasetBuilder image = anImage("1." + QByteArray::number(i + 1));
            image.inSeries(i < count ? "1.2.3" : "1.2.4").with(DCM_SpecificCharacterSet, "ISO_IR 100");
            image.with(DCM_PatientName, "M\xfcller").with(DCM_InstanceNumber, QByteArray::number(i));
            image.withLong(DCM_PatientComments, 3000);
            file.addTagMap(image.map(), nullptr, true);
        }
        file.optimizeAll();
        EXPECT_TRUE(file.writeCacheFile());
    }

    Received get(const QByteArray& address, const Headers& headers = {})
    {
        const Http::Request request = requestFor("/studies/" + address, headers);
        ResourcePath path;
        EXPECT_TRUE(ResourcePath::parse(request.path, path));
        EXPECT_TRUE(mResource.owns(path));
        return received(mResource.answer(request, path));
    }

    static Received received(const Http::Response& response)
    {
        Received received = {response.status, bodyOf(response), false, {}};
        for (const Http::Field& header : response.headers)
            received.headers.insert(header.name, header.value);
        for (const Http::BodyPart& part : response.body)
            received.wasKept = received.wasKept || std::holds_alternative<Http::FileRange>(part);
        return received;
    }

    /// What the images are by the library's function for one image.
    static QByteArray expected(const std::function<QByteArray(const TagMap& image)>& rootOf,
                               const char* series = "")
    {
        TagFile file;
        EXPECT_TRUE(file.readCacheFileForStudy("1.2", false));
        std::ostringstream out;
        const char* separator = "[";
        for (const TagMap* each : file.study()->children()) {
            for (const TagMap* image : each->children()) {
                if (*series != '\0' && each->uid(TagMap::SeriesLevel) != series)
                    continue;
                out << separator;
                writeDicomJson(out, *image, rootOf(*image).toStdString());
                separator = ",";
            }
        }
        return QByteArray::fromStdString(out.str() + "]");
    }

    QStringList keptFiles() const { return filesBelow(mStore.filePath("answers")); }

    TemporaryStore mStore;
    Setting mPatience{"KDD_READ_PATIENCE", "0"};
    StudyShelf mShelf{1 << 30};
    MetadataResource mResource{mShelf, mStore.filePath("answers"), 1 << 20};
};

TEST_F(MetadataTest, IsThatOfEachImageWithAddressesThatLeadToItsBulkData)
{
    write();
    const auto below = [](const TagMap& image) {
        return "instances/" + image.uid(TagMap::ImageLevel) + "/bulkdata";
    };
    const auto ofStudy = [&](const TagMap& image) {
        return "series/" + image.uid(TagMap::SeriesLevel) + '/' + below(image);
    };
    EXPECT_EQ(get("1.2/metadata").body, expected(ofStudy));
    EXPECT_EQ(get("1.2/series/1.2.4/metadata").body, expected(below, "1.2.4"));
    const char* const addresses[] = {"1.2/metadata", "1.2/series/1.2.3/metadata",
                                     "1.2/series/1.2.3/instances/1.1/metadata"};
    for (const char* address : addresses) {
        const Received received = get(address);
        EXPECT_EQ(received.headers.value("Content-Type"), "application/dicom+json");
        const QString uri = jsonAt(received.body, "0/00104000/BulkDataURI").toString();
        const QUrl base(QStringLiteral("http://h/dicom-web/studies/") + QLatin1String(address));
        EXPECT_EQ(base.resolved(QUrl(uri)).path().toStdString(),
                  "/dicom-web/studies/1.2/series/1.2.3/instances/1.1/bulkdata/00104000");
    }
}

TEST_F(MetadataTest, IsGivenInTheFormThatIsAskedFor)
{
    write(1);
    const std::tuple<const char*, int, const char*> kForms[] = {
        {"*/*", 200, "application/dicom+json"},
        {"application/json", 200, "application/json"},
        {"application/dicom+json;q=0.1, application/json", 200, "application/json"},
        {"multipart/related; type=\"application/dicom+xml\"", 200, "multipart/related"},
        {"multipart/related; type=application/dicom+xml", 200, "multipart/related"},
        {"text/html", 406, "text/plain; charset=utf-8"},
        {"multipart/related; type=\"application/octet-stream\"", 406, "text/plain; charset=utf-8"},
    };
    for (const auto& [accept, status, type] : kForms) {
        const Received received = get("1.2/metadata", {{"accept", accept}});
        EXPECT_EQ(received.status, status) << accept;
        EXPECT_TRUE(received.headers.value("Content-Type").startsWith(type)) << accept;
    }
    const Received xml =
        get("1.2/metadata", {{"accept", "multipart/related; type=\"application/dicom+xml\""}});
    const QByteArray type = xml.headers.value("Content-Type");
    const QByteArray boundary = "--" + type.mid(type.indexOf("boundary=") + 9);
    EXPECT_EQ(xml.body.count(boundary + "\r\nContent-Type: application/dicom+xml\r\n\r\n<?xml"), 2);
    EXPECT_TRUE(xml.body.endsWith("\r\n" + boundary + "--\r\n"));
}

TEST_F(MetadataTest, HoldsOnlyTheFieldsThatAreNamed)
{
    write(1);
    // So many attributes; none: refused.
    const std::pair<const char*, int> kForms[] = {
        {"includefield=PatientName", 5},
        {"includefield=00100010,InstanceNumber&includefield=00080016", 7},
        {"includefield=PatientName&includefield=all", 8},
        {"includefield=", 0},
        {"includefield=NoSuchName", 0},
        {"includefield=../x", 0},
    };
    for (const auto& [query, attributes] : kForms) {
        const Received received = get(QByteArray("1.2/series/1.2.3/metadata?") + query);
        EXPECT_EQ(received.status, attributes == 0 ? 400 : 200) << query;
        EXPECT_EQ(jsonAt(received.body, "0").toObject().size(), attributes) << query;
    }
}

TEST_F(MetadataTest, SaysWhatIsNotThere)
{
    const LogCapture log;
    EXPECT_EQ(get("1.2/metadata").status, 404);
    write();
    EXPECT_EQ(get("1.2/series/1.9/metadata").status, 404);
    EXPECT_EQ(get("1.2/series/1.2.4/instances/1.1/metadata").status, 404) << "it is in the other series";
    EXPECT_EQ(get("1.2/series/1.9/metadata", {{"if-none-match", "*"}}).status, 404);
    {
        TagFile holder;
        ASSERT_TRUE(holder.readCacheFileForStudy("1.2", true));
        const Received held = get("1.2/metadata");
        EXPECT_EQ(held.status, 503);
        EXPECT_EQ(held.headers.value("Retry-After"), "2");
    }
    putFile(TagFile::cacheFilePathForStudy("1.2"), "no tag file");
    const Received damaged = get("1.2/metadata");
    EXPECT_EQ(damaged.status, 500);
    EXPECT_FALSE(damaged.body.contains(".tc")) << "no names of files";
}

TEST_F(MetadataTest, IsKeptCompressedAndTheSameEachTime)
{
    write();
    const QByteArray plain = get("1.2/metadata").body;
    const Received first = get("1.2/metadata", kGzip);
    const Received second = get("1.2/metadata", kGzip);
    EXPECT_FALSE(first.wasKept);
    EXPECT_TRUE(second.wasKept);
    EXPECT_EQ(mResource.keptCount().misses.load(), 1);
    EXPECT_EQ(mResource.keptCount().hits.load(), 1);
    EXPECT_EQ(first.headers.value("Content-Encoding"), "gzip");
    EXPECT_EQ(first.headers, second.headers);
    EXPECT_EQ(first.body, second.body);
    EXPECT_EQ(unpacked(first.body), plain);
    EXPECT_NE(first.tag(), get("1.2/metadata").tag()) << "compressed bytes are other bytes";
    EXPECT_EQ(unpacked(get("1.2/series/1.2.3/instances/1.1/metadata", kGzip).body),
              get("1.2/series/1.2.3/instances/1.1/metadata").body);
    EXPECT_FALSE(get("1.2/metadata?includefield=PatientName", kGzip).wasKept);
    EXPECT_EQ(keptFiles().size(), 2);
}

TEST_F(MetadataTest, IsMadeOfATagFileThatIsReadOnce)
{
    write();
    LogFile::setLevel(LogFile::Level::Timing);
    const LogCapture log;
    get("1.2/metadata");  // of a file so young that it may be changed unnoticed
    EXPECT_EQ(log.count("Cache file read"), 1);
}

TEST_F(MetadataTest, IsNotSentAgainToWhoeverHasIt)
{
    write();
    const Received first = get("1.2/metadata");
    for (const QByteArray& held :
         {first.tag(), "\"x\", " + first.tag(), "W/" + first.tag(), QByteArray("*")}) {
        const Received again = get("1.2/metadata", {{"if-none-match", held}});
        EXPECT_EQ(again.status, 304) << held.constData();
        EXPECT_EQ(again.tag(), first.tag());
        EXPECT_TRUE(again.body.isEmpty());
    }
    EXPECT_EQ(get("1.2/series/1.2.3/metadata", {{"if-none-match", first.tag()}}).status, 200);
    EXPECT_EQ(get("1.2/metadata?includefield=PatientName", {{"if-none-match", first.tag()}}).status, 200);
}

TEST_F(MetadataTest, ShowsAChangeAtOnceAlsoWhereItIsKept)
{
    write();
    get("1.2/metadata", kGzip);
    const Received before = get("1.2/metadata", kGzip);
    ASSERT_TRUE(before.wasKept);
    TagFile file;
    file.addTagMap(anImage("1.1").inSeries("1.2.3").with(DCM_PatientName, "New").map(), nullptr, true);
    ASSERT_TRUE(file.mergeIntoCacheFile());
    const Received after = get("1.2/metadata", {kGzip.first(), {"if-none-match", before.tag()}});
    EXPECT_EQ(after.status, 200);
    EXPECT_FALSE(after.wasKept);
    EXPECT_NE(after.tag(), before.tag());
    EXPECT_TRUE(unpacked(after.body).contains("New"));
    EXPECT_FALSE(unpacked(before.body).contains("New"));
}

TEST_F(MetadataTest, KeepsNothingOfAnAnswerThatIsNotTakenToItsEnd)
{
    write(2000);  // more than one block compressed
    const Http::Request request = requestFor("", kGzip);
    ResourcePath path;
    path.study = "1.2";
    path.resource = "metadata";
    {
        Http::Response response = mResource.answer(request, path);
        QByteArray block;
        ASSERT_TRUE(std::get<std::unique_ptr<Http::Producer>>(response.body.front())->next(block).good());
    }
    EXPECT_TRUE(keptFiles().isEmpty());
    EXPECT_FALSE(get("1.2/metadata", kGzip).wasKept);
}

TEST(KeptAnswers, LetsGoOfThoseThatWereNotUsedTheLongest)
{
    const TemporaryStore store;
    KeptAnswers answers(store.filePath("kept"), 1000);
    Http::FileRange range;
    const auto keep = [&](const QByteArray& name) {
        const auto draft = answers.begin(name);
        draft->write(QByteArray(300, name.at(0)));
        EXPECT_FALSE(answers.find(name, range)) << "not before it is whole";
        draft->keep();
        // Long ago, in the order of the names.
        const QByteArray file = store.filePath("kept").toLocal8Bit() + '/' + name.left(2) + '/' + name;
        const timespec times[] = {{1000 + name.at(0), 0}, {1000 + name.at(0), 0}};
        ::utimensat(AT_FDCWD, file.constData(), times, 0);
    };
    keep("aa1");
    keep("bb1");
    keep("cc1");
    EXPECT_TRUE(answers.find("aa1", range)) << "used now";
    const Http::FileRange held = range;
    keep("dd1");
    EXPECT_FALSE(answers.find("bb1", range));
    EXPECT_TRUE(answers.find("aa1", range) && answers.find("cc1", range) && answers.find("dd1", range));
    QByteArray bytes;
    EXPECT_TRUE(held.file->read(held.offset, held.length, bytes).good());
    EXPECT_EQ(bytes, QByteArray(300, 'a'));
    EXPECT_EQ(KeptAnswers(store.filePath("none"), 0).begin("aa2"), nullptr);
}

}  // namespace
