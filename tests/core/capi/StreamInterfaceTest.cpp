#include "kddlib/capi/kddstream.h"
#include "support/HttpServer.h"
#include "support/LogCapture.h"
#include "support/ObjectServer.h"
#include "support/Setting.h"

#include <gtest/gtest.h>

namespace Kdd
{
namespace
{

/// All that a C program reads of an object, with `mark` behind each block; "(failed)" follows when one failed.
QByteArray readDicom(const std::string& url, void* userInfo, const char* mark = "")
{
    QByteArray content;
    uint32_t isLast = 0;
    for (int isFirst = 1; !isLast; isFirst = 0) {
        uint32_t length = 1;
        const char* data = "";
        if (ReadDicomFromUrl(url.c_str(), userInfo, &length, &data, isFirst, &isLast) != KDD_READ) {
            EXPECT_TRUE(length == 0 && data == nullptr && !isLast);
            return content + "(failed)";
        }
        content.append(data, static_cast<int>(length)).append(mark);
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
    ~StreamInterface() override
    {
        CloseStream(stream);
        DeleteUserInfo(info);
    }

    const QByteArray object = someObject(100000);
    NginxServer server;
    const std::string url = server.url("object");
    void* stream = nullptr;
    void* info = CreateUserInfo();
    LogCapture log;
};

TEST_F(StreamInterface, BlocksOfTheWholeOrOfARangeComeInOrderUntilTheEnd)
{
    const std::pair<const char*, QByteArray> rows[] = {{nullptr, object},
                                                       {"500-1499", object.mid(500, 1000)}};
    for (const auto& [range, expected] : rows) {
        ASSERT_EQ(range != nullptr ? OpenStreamRange(url.c_str(), range, &stream)
                                   : OpenStream(url.c_str(), &stream),
                  KDD_STREAM_OPENED);
        const int rest = expected.size() - 700;
        QByteArray read(expected.size(), '\0');
        EXPECT_EQ(StreamContentLength(stream), 100000U) << "also of a range that of the whole";
        EXPECT_EQ(ReadBytes(stream, read.data(), 0, 700), 700);
        EXPECT_EQ(ReadBytes(stream, read.data(), 700, rest + 1), rest);
        EXPECT_EQ(read, expected);
        CloseStream(std::exchange(stream, nullptr));
    }
}

TEST_F(StreamInterface, WhatCannotBeOpenedLeavesTheHandleAloneAndOneLine)
{
    int untouched = 0;
    stream = &untouched;
    EXPECT_EQ(OpenStream(server.url("absent").c_str(), &stream), KDD_STREAM_FAILED);
    EXPECT_EQ(log.count("Reading " + server.url("absent") + " failed: HTTP response code 404"), 1);
    EXPECT_EQ(OpenStreamRange(url.c_str(), "0-1\r\nX: y", &stream), KDD_STREAM_FAILED);
    EXPECT_EQ(log.count("OpenStreamRange: Failed to add curl request header"), 1);
    EXPECT_EQ(std::exchange(stream, nullptr), &untouched);
}

TEST_F(StreamInterface, ADicomFileComesInBlocksOfWhichTheLastMayBeEmpty)
{
    const QByteArray block = someObject(KDD_BLOCK_SIZE);
    server.addFile("two", block + block);
    server.addFile("none", {});
    EXPECT_EQ(readDicom(url, info), object);
    EXPECT_EQ(readDicom(server.url("two"), info, "|"), block + '|' + block + "||");
    EXPECT_EQ(readDicom(server.url("absent"), info), "(failed)");
    EXPECT_EQ(readDicom(server.url("none"), info, "|"), "|");
}

TEST_F(StreamInterface, AfterAFailureNothingMoreComesAndNothingStays)
{
    const ScriptedServer cut(httpResponse(QByteArray(40000, 'x')).chopped(20000));
    // Curl refuses an address of this length, which is thrown.
    const std::string tooLong = server.url(std::string(8'000'001, 'x'));
    EXPECT_EQ(readBlock(info), KDD_NOT_READ) << "before the first";
    for (const std::string& bad : {cut.url("x"), tooLong}) {
        EXPECT_EQ(readBlock(info, url.c_str()), KDD_READ);
        // Whether the first block is still given depends on how soon the end of the transfer is seen.
        const QByteArray read = readDicom(bad, info);
        EXPECT_TRUE((QByteArray(KDD_BLOCK_SIZE, 'x') + "(failed)").endsWith(read)) << read.constData();
        EXPECT_EQ(readBlock(info), KDD_NOT_READ);
    }
    EXPECT_EQ(log.count("ReadDicomFromUrl: Error code: "), 1);
    EXPECT_EQ(readDicom(url, info), object);
}

TEST_F(StreamInterface, NullsAndNegativeNumbersAreRefusedWithALineEach)
{
    ASSERT_EQ(OpenStream(url.c_str(), &stream), KDD_STREAM_OPENED);
    char byte = 0;
    EXPECT_EQ(OpenStream("http://a", nullptr), KDD_STREAM_FAILED);
    EXPECT_EQ(OpenStreamRange("http://a", nullptr, &stream), KDD_STREAM_FAILED);
    EXPECT_EQ(ReadBytes(nullptr, &byte, 0, 1), 0);
    EXPECT_EQ(ReadBytes(stream, nullptr, 0, 1), 0);
    EXPECT_EQ(ReadBytes(stream, &byte, -1, 1), 0);
    EXPECT_EQ(ReadBytes(stream, &byte, 0, -1), 0);
    EXPECT_EQ(StreamContentLength(nullptr), 0U);
    EXPECT_EQ(ReadDicomFromUrl("http://a", nullptr, nullptr, nullptr, 1, nullptr), KDD_NOT_READ);
    EXPECT_EQ(readDicom("http://a", nullptr), "(failed)");
    EXPECT_FALSE(DeleteObject(nullptr) || StringIsUrl(nullptr));
    EXPECT_EQ(log.count(" must not be "), 10);
    EXPECT_EQ(ReadBytes(stream, &byte, 0, 1), 1) << "the stream still is where it was";
    CloseStream(nullptr);
    DeleteUserInfo(nullptr);
}

TEST_F(StreamInterface, ADeletionThatCannotBeSentIsAFailureWithALine)
{
    const Setting cloud("KDD_CLOUD_API", "http://127.0.0.1:1/");
    EXPECT_TRUE(DeleteObject("https://a.invalid/x"));
    EXPECT_FALSE(DeleteObject("gs://b/there"));
    EXPECT_EQ(log.count("DeleteObject: Error code: "), 1);
}

}  // namespace
}  // namespace Kdd
