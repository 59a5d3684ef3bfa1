#include "kddlib/capi/kddstream.h"
#include "support/HttpServer.h"
#include "support/LogCapture.h"
#include "support/ObjectServer.h"

#include <gtest/gtest.h>

#include <stdexcept>

namespace Kdd
{
namespace
{

/// All that a C program reads of an object; "(failed)" follows when a block failed.
QByteArray readDicom(const std::string& url, void* userInfo, int* blocks = nullptr)
{
    QByteArray content;
    uint32_t isLast = 0;
    for (int i = 0; !isLast; ++i) {
        uint32_t length = 1;
        const char* data = "";
        if (ReadDicomFromUrl(url.c_str(), userInfo, &length, &data, i == 0, &isLast) != KDD_READ) {
            EXPECT_TRUE(length == 0 && data == nullptr && !isLast);
            return content + "(failed)";
        }
        content.append(data, static_cast<int>(length));
        if (blocks != nullptr)
            *blocks = i + 1;
    }
    return content;
}

/// Asks for the next block of what was read last, or for the first of an object.
int readBlock(void* userInfo, const char* url = nullptr)
{
    uint32_t length = 1, isLast = 1;
    const char* data = nullptr;
    return ReadDicomFromUrl(url, userInfo, &length, &data, url != nullptr, &isLast);
}

class StreamInterface : public testing::Test
{
protected:
    StreamInterface() { server.addFile("object", object); }

    /// The handle of an open that has to fail.
    static void* refused(int result, void* handle)
    {
        EXPECT_EQ(result, KDD_STREAM_FAILED);
        return handle;
    }

    const QByteArray object = someObject(100000);
    NginxServer server;
};

TEST_F(StreamInterface, BlocksOfTheWholeOrARangeComeInOrderUntilTheEnd)
{
    void* stream = nullptr;
    ASSERT_EQ(OpenStream(server.url("object").c_str(), &stream), KDD_STREAM_OPENED);
    EXPECT_EQ(StreamContentLength(stream), 100000U);
    QByteArray read(100000, '\0');
    EXPECT_EQ(ReadBytes(stream, read.data(), 0, 70000), 70000);
    EXPECT_EQ(ReadBytes(stream, read.data(), 70000, 0), 0);
    EXPECT_EQ(ReadBytes(stream, read.data(), 70000, 30000), 30000);
    EXPECT_EQ(read, object);
    EXPECT_EQ(ReadBytes(stream, read.data(), 0, 1), 0);
    CloseStream(stream);

    ASSERT_EQ(OpenStreamRange(server.url("object").c_str(), "500-1499", &stream), KDD_STREAM_OPENED);
    EXPECT_EQ(StreamContentLength(stream), 100000U) << "of the whole";
    EXPECT_EQ(ReadBytes(stream, read.data(), 0, 2000), 1000);
    EXPECT_EQ(read.left(1000), object.mid(500, 1000));
    CloseStream(stream);
}

TEST_F(StreamInterface, WhatCannotBeOpenedLeavesTheHandleAloneAndOneLine)
{
    const std::string absent = server.url("absent");
    const std::string present = server.url("object");
    int untouched = 0;
    void* handle = &untouched;
    const LogCapture log;
    EXPECT_EQ(refused(OpenStream(absent.c_str(), &handle), handle), &untouched);
    EXPECT_EQ(log.count("Reading " + absent + " failed: HTTP response code 404"), 1);
    EXPECT_EQ(refused(OpenStream("file:///etc/passwd", &handle), handle), &untouched);
    EXPECT_EQ(refused(OpenStreamRange(present.c_str(), "200000-", &handle), handle), &untouched);
    EXPECT_EQ(refused(OpenStreamRange(present.c_str(), "0-1\r\nX: y", &handle), handle), &untouched);
    EXPECT_EQ(log.count("OpenStreamRange: Failed to add curl request header"), 1);
}

TEST_F(StreamInterface, ADicomFileComesInBlocksOfWhichTheLastMayBeEmpty)
{
    const QByteArray twoBlocks = someObject(2 * KDD_BLOCK_SIZE);
    server.addFile("two", twoBlocks);
    server.addFile("none", {});
    void* const info = CreateUserInfo();
    int blocks = 0;
    EXPECT_EQ(readDicom(server.url("object"), info, &blocks), object);
    EXPECT_EQ(blocks, 7);
    EXPECT_EQ(readDicom(server.url("two"), info, &blocks), twoBlocks);
    EXPECT_EQ(blocks, 3);
    EXPECT_EQ(readDicom(server.url("absent"), info), "(failed)");
    EXPECT_EQ(readDicom(server.url("none"), info), "");
    DeleteUserInfo(info);
}

TEST_F(StreamInterface, ATransferThatBreaksOffIsNoWholeObject)
{
    const ScriptedServer cut([](const QByteArray&) -> ScriptedServer::Reply {
        return {"HTTP/1.1 200 OK\r\nContent-Length: 40000\r\n\r\n" + QByteArray(20000, 'x')};
    });
    const LogCapture log;
    void* const info = CreateUserInfo();
    // Whether the first block is still given depends on how soon the end of the transfer is seen.
    const QByteArray read = readDicom(cut.url("x"), info);
    EXPECT_TRUE((QByteArray(KDD_BLOCK_SIZE, 'x') + "(failed)").endsWith(read)) << read.constData();
    EXPECT_TRUE(read.endsWith("(failed)"));
    EXPECT_EQ(readBlock(info), KDD_NOT_READ) << "nothing more comes";
    EXPECT_EQ(readDicom(server.url("object"), info), object) << "nor stays";
    DeleteUserInfo(info);
}

TEST_F(StreamInterface, AfterAnOpeningThatFailsNothingOfAnEarlierObjectFollows)
{
    // Curl refuses an address of this length, which is thrown.
    const std::string tooLong = server.url(std::string(8'000'001, 'x'));
    void* const info = CreateUserInfo();
    EXPECT_EQ(readBlock(info), KDD_NOT_READ) << "before the first";
    EXPECT_EQ(readBlock(info, server.url("object").c_str()), KDD_READ);
    const LogCapture log;
    EXPECT_EQ(readDicom(tooLong, info), "(failed)");
    EXPECT_EQ(log.count("ReadDicomFromUrl: Error code: "), 1);
    EXPECT_EQ(readBlock(info), KDD_NOT_READ);
    DeleteUserInfo(info);
}

TEST_F(StreamInterface, NullsAndNegativeNumbersAreRefusedWithALineEach)
{
    void* stream = nullptr;
    ASSERT_EQ(OpenStream(server.url("object").c_str(), &stream), KDD_STREAM_OPENED);
    char byte = 0;
    const LogCapture log;
    EXPECT_EQ(OpenStream("http://a", nullptr), KDD_STREAM_FAILED);
    EXPECT_EQ(OpenStreamRange("http://a", nullptr, &stream), KDD_STREAM_FAILED);
    EXPECT_EQ(ReadBytes(nullptr, &byte, 0, 1), 0);
    EXPECT_EQ(ReadBytes(stream, nullptr, 0, 1), 0);
    EXPECT_EQ(ReadBytes(stream, &byte, -1, 1), 0);
    EXPECT_EQ(ReadBytes(stream, &byte, 0, -1), 0);
    EXPECT_EQ(StreamContentLength(nullptr), 0U);
    EXPECT_EQ(ReadDicomFromUrl("http://a", nullptr, nullptr, nullptr, 1, nullptr), KDD_NOT_READ);
    EXPECT_EQ(readDicom("http://a", nullptr), "(failed)");
    EXPECT_FALSE(DeleteObject(nullptr));
    EXPECT_EQ(log.count(" must not be "), 10);
    EXPECT_EQ(ReadBytes(stream, &byte, 0, 1), 1) << "the stream still is where it was";
    CloseStream(stream);
    CloseStream(nullptr);
    DeleteUserInfo(nullptr);
}

TEST(StreamAddresses, AreToldByTheirBeginningsAndOnlyTheCloudsAreDeleted)
{
    EXPECT_TRUE(StringIsUrl("https://a") && StringIsUrl("gs://bucket/object"));
    EXPECT_FALSE(StringIsUrl("ftp://a") || StringIsUrl("") || StringIsUrl(nullptr));
    EXPECT_TRUE(DeleteObject("https://a.invalid/x"));
    ScriptedServer cloud([](const QByteArray& request) -> ScriptedServer::Reply {
        return {request.startsWith("DELETE /b/there ")
                    ? "HTTP/1.1 204 No Content\r\n\r\n"
                    : "HTTP/1.1 404 Not Found\r\nContent-Length: 0\r\n\r\n"};
    });
    qputenv("KDD_CLOUD_API", cloud.url("").c_str());
    EXPECT_TRUE(DeleteObject("gs://b/there"));
    EXPECT_FALSE(DeleteObject("gs://b/absent"));
    EXPECT_FALSE(DeleteObject("gs://b/there?x")) << "nor what comes before";
    qputenv("KDD_CLOUD_API", "http://127.0.0.1:1/");
    const LogCapture log;
    EXPECT_FALSE(DeleteObject("gs://b/there"));
    EXPECT_EQ(log.count("DeleteObject: Error code: "), 1);
    qunsetenv("KDD_CLOUD_API");
}

}  // namespace
}  // namespace Kdd
