#include "kddlib/net/dicom/RemoteFile.h"

#include "kddlib/net/dicom/RemoteDicom.h"
#include "kddlib/net/http/ObjectAddress.h"
#include "support/DatasetBuilder.h"
#include "support/FileContent.h"
#include "support/ObjectServer.h"

#include <gmock/gmock.h>

#include <atomic>

using namespace Kdd;
using testing::HasSubstr;

namespace
{

std::shared_ptr<RemoteFile> open(const std::string& url, qint64 first = 1000)
{
    Result result;
    std::shared_ptr<RemoteFile> file = RemoteFile::open(QByteArray::fromStdString(url), first, result);
    EXPECT_EQ(file == nullptr, result.bad());
    return file;
}

std::string faultOf(const std::string& url)
{
    Result result;
    EXPECT_EQ(RemoteFile::open(QByteArray::fromStdString(url), 1000, result), nullptr);
    return result.text().toStdString();
}

QByteArray part(RemoteFile& file, qint64 offset, int count)
{
    QByteArray bytes(count, '\0');
    bytes.resize(static_cast<int>(qMax<qint64>(0, file.readAt(offset, bytes.data(), count))));
    return bytes;
}

/// How servers send an object, and what is asked of each to read a little here and there.
struct Sender
{
    const char* name;
    std::function<QByteArray(const QByteArray& object, const QByteArray& request)> reply;
    int requests;
};

QByteArray whole(const QByteArray& object, const QByteArray& headers)
{
    return "HTTP/1.1 200 OK\r\nETag: \"a\"\r\n" + headers + "\r\n" + object;
}

QByteArray ranged(const QByteArray& object, const QByteArray& request, const QByteArray& total)
{
    const QByteArray range = headerOf(request, "Range").mid(6);
    const int first = range.split('-').at(0).toInt();
    const int last = qMin(range.split('-').at(1).toInt(), object.size() - 1);
    return "HTTP/1.1 206 -\r\nETag: \"a\"\r\nContent-Range: bytes " + QByteArray::number(first) + '-' +
           QByteArray::number(last) + '/' + total + "\r\n\r\n" + object.mid(first, last - first + 1);
}

const Sender kSenders[] = {
    {"Ranges",
     [](const QByteArray& object, const QByteArray& request) {
         return ranged(object, request, QByteArray::number(object.size()));
     },
     5},
    {"NoRanges",
     [](const QByteArray& object, const QByteArray& /*request*/) {
         return whole(object, "Content-Length: " + QByteArray::number(object.size()) + "\r\n");
     },
     3},
    {"Chunks",
     [](const QByteArray& object, const QByteArray& /*request*/) { return chunkedResponse(object); }, 2},
    {"RangesWithoutLength",
     [](const QByteArray& object, const QByteArray& request) {
         return headerOf(request, "Range").isEmpty() ? unmeasuredResponse(object)
                                                     : ranged(object, request, "*");
     },
     2},
};

TEST(RemoteFile, ReadsWhatIsAskedForWhereverItIs)
{
    const QByteArray object = someObject(3'000'000);
    for (const Sender& sender : kSenders) {
        SCOPED_TRACE(sender.name);
        const ScriptedServer server(
            [&](const QByteArray& request) { return ScriptedServer::Reply{sender.reply(object, request)}; });
        const auto file = open(server.url("a"));
        ASSERT_NE(file, nullptr);
        EXPECT_EQ(file->size(), object.size());
        EXPECT_NE(file->version(), 0);
        // On, over what was fetched, across its end, far on, and back.
        for (const auto& [offset, count] :
             {std::pair(0, 132), {100, 900}, {990, 20}, {40'000, 100}, {2'999'990, 100}, {10, 50}})
            EXPECT_EQ(part(*file, offset, count), object.mid(offset, count)) << offset;
        EXPECT_EQ(part(*file, object.size(), 10), "");
        EXPECT_EQ(int(server.requests().size()), sender.requests);
    }
}

TEST(RemoteFile, IsNotOpenedWhenItIsNotThere)
{
    EXPECT_EQ(faultOf(ScriptedServer(httpResponse("no", "404 Not Found")).url("a")),
              "HTTP response code 404");
    EXPECT_EQ(faultOf(ScriptedServer(httpResponse("", "302 Found")).url("a")), "HTTP response code 302");
    EXPECT_THAT(faultOf("http://127.0.0.1:1/a"), HasSubstr("Failed to connect"));
    EXPECT_THAT(faultOf(ObjectServer(someObject(5000), [](auto& answer) { answer.body.chop(1); }).url()),
                HasSubstr("early"));
    EXPECT_THAT(faultOf(ObjectServer(someObject(5000), [](auto& answer) { ++answer.first; }).url()),
                HasSubstr("another range"));
    EXPECT_THAT(faultOf(ScriptedServer(chunkedResponse(someObject(5000)).chopped(kEndOfChunks)).url("a")),
                HasSubstr("outstanding"));
    const auto empty = open(ScriptedServer(httpResponse("", "416 Range Not Satisfiable")).url("a"));
    ASSERT_NE(empty, nullptr);
    EXPECT_EQ(empty->size(), 0);
}

const std::pair<const char*, ObjectServer::Spoil> kSpoils[] = {
    {"changed", [](auto& answer) { answer.entityTag = "\"v2\""; }},
    {"changed", [](auto& answer) { answer.total = "4999999"; }},
    {"whole object", [](auto& answer) { answer.code = 200; }},
    {"404", [](auto& answer) { answer.code = 404; }},
    {"early", [](auto& answer) { answer.body.chop(1); }},
};

TEST(RemoteFile, GivesNothingMoreOnceTheServerHasAnotherObject)
{
    for (const auto& [reason, spoil] : kSpoils) {
        std::atomic<bool> isSpoiled{false};
        const QByteArray object = someObject(2'000'000);
        const ObjectServer server(object, [&, spoil = spoil](ObjectServer::Answer& answer) {
            if (isSpoiled)
                spoil(answer);
        });
        const auto file = open(server.url());
        ASSERT_NE(file, nullptr);
        EXPECT_EQ(part(*file, 500, 1000), object.mid(500, 1000));
        isSpoiled = true;
        EXPECT_EQ(part(*file, 1'000'000, 1'000'000), "") << reason;
        EXPECT_THAT(file->fault().text().toStdString(), HasSubstr(reason));
        isSpoiled = false;
        EXPECT_EQ(part(*file, 1'000'000, 100), "") << "also when it is back";
    }
}

/// What a server without ranges sends when it is asked for what has gone by.
const std::pair<const char*, QByteArray> kSecondAnswers[] = {
    {"changed", httpResponse(someObject(2'999'999))},
    {"changed", whole(someObject(3'000'000), "Content-Length: 3000000\r\n")},
    {"404", httpResponse("no", "404 Not Found")},
    {"with 1 bytes", httpResponse(someObject(3'000'000)).chopped(1)},
};

TEST(RemoteFile, DoesNotGoBackInAWholeObjectThatIsAnotherOrBreaksOff)
{
    const QByteArray object = someObject(3'000'000);
    for (const auto& [reason, second] : kSecondAnswers) {
        std::atomic<int> asked{0};
        const ScriptedServer server([&, second = second](const QByteArray& /*request*/) {
            // First in vain for a range, then for the whole.
            return ScriptedServer::Reply{asked++ < 2 ? httpResponse(object) : second};
        });
        const auto file = open(server.url("a"));
        ASSERT_NE(file, nullptr);
        EXPECT_EQ(part(*file, 400'000, 100), object.mid(400'000, 100));
        EXPECT_EQ(part(*file, 300'000, 2'700'000), "");
        EXPECT_THAT(file->fault().text().toStdString(), HasSubstr(reason));
    }
}

TEST(RemoteFile, IsKnownAgainByWhatTheServerSaysOfItsVersion)
{
    const auto version = [](const QByteArray& headers) {
        const auto file = open(
            ScriptedServer("HTTP/1.1 206 -\r\nContent-Range: bytes 0-1/2\r\n" + headers + "\r\nab").url("a"));
        return file != nullptr ? file->version() : -1;
    };
    EXPECT_EQ(version(""), 0);
    EXPECT_EQ(version("ETag: \"1\"\r\nLast-Modified: x\r\n"), version("ETag: \"1\"\r\nLast-Modified: y\r\n"));
    EXPECT_NE(version("ETag: \"1\"\r\n"), version("ETag: \"2\"\r\n"));
    EXPECT_NE(version("Last-Modified: x\r\n"), version("Last-Modified: y\r\n"));
    EXPECT_EQ(version("x-goog-generation: 1\r\nETag: \"1\"\r\n"),
              version("x-goog-generation: 1\r\nETag: \"2\"\r\n"));
}

/// A file whose long values are asked for later.
TEST(RemoteDicom, LeavesLongValuesWhereTheyAreAndFetchesThemFromTheSameObjectOnly)
{
    const QByteArray saved =
        anImage().withLong(DCM_TextValue, 300'000).words(std::vector<Uint16>(500'000, 7)).file();
    std::atomic<bool> isSpoiled{false};
    std::atomic<qint64> sent{0};
    const ObjectServer server(saved, [&](ObjectServer::Answer& answer) {
        sent += answer.body.size();
        if (isSpoiled)
            answer.entityTag = "\"v2\"";
    });
    DcmFileFormat format;
    ASSERT_TRUE(loadDicomHeader(QByteArray::fromStdString(server.url()), format).good());
    EXPECT_LT(sent, 200'000);
    OFString text;
    EXPECT_TRUE(format.getDataset()->findAndGetOFString(DCM_TextValue, text).good());
    EXPECT_EQ(text.size(), 300'000U);
    DcmElement* pixels = nullptr;
    Uint16 few[4] = {};
    ASSERT_TRUE(format.getDataset()->findAndGetElement(DCM_PixelData, pixels).good());
    EXPECT_TRUE(pixels->getPartialValue(few, 600'000, sizeof few).good());
    EXPECT_EQ(few[3], 7);
    EXPECT_LT(sent, 1'000'000);
    isSpoiled = true;
    EXPECT_TRUE(pixels->getPartialValue(few, 0, sizeof few).bad());
}

const char* const kShown[][2] = {
    {"/data/a?token=1", "/data/a?token=1"},
    {"http://host/a.dcm", "http://host/a.dcm"},
    {"http://me:s@cret@host:80/a@b", "http://***@host:80/a@b"},
    {"https://host/wado?objectUID=1.2&studyUID=1", "https://host/wado?objectUID=1.2&studyUID=1"},
    {"https://host/a?X-Goog-Signature=ab&x=1&access_token=c",
     "https://host/a?X-Goog-Signature=***&x=1&access_token=***"},
    {"https://host/a?s=session&sig=1", "https://host/a?s=***&sig=***"},
    {"https://me@host?x=1@2", "https://***@host?x=1@2"},
    {"gs://bucket/a?generation=5", "gs://bucket/a?generation=5"},
};

TEST(ObjectAddress, IsShownWithoutWhatLetsOthersIn)
{
    for (const auto& row : kShown)
        EXPECT_EQ(shownAddress(row[0]), QByteArray(row[1]));
    EXPECT_TRUE(isObjectAddress("gs://b/o") && isObjectAddress("http://h/o"));
    EXPECT_FALSE(isObjectAddress("gsm/a.dcm") || isObjectAddress("https") || isObjectAddress("/a/http://b"));
}

}  // namespace
