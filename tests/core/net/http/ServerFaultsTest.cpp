#include "kddlib/net/KxCurlClient.h"
#include "kddlib/net/http/KxHttpStatus.h"
#include "support/HttpServer.h"
#include "support/LogCapture.h"

#include <gtest/gtest.h>

using namespace Kdd;

namespace
{

struct ServerFault
{
    const char* name;
    ScriptedServer::Reply reply;
    const char* body;
    const char* reason;
};

const ServerFault kServerFaults[] = {
    {"BodyEndsEarly", {"HTTP/1.1 200 OK\r\nContent-Length: 9\r\n\r\nfour"}, "four", "5 bytes remaining"},
    {"ResetInTheBody", {"HTTP/1.1 200 OK\r\nContent-Length: 9\r\n\r\nfour", {}, true}, "four", "transfer: "},
    {"ChunkEndsEarly",
     {"HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\n9\r\nfour"},
     "four",
     "outstanding"},
    {"LengthIsNoNumber", {"HTTP/1.1 200 OK\r\nContent-Length: nine\r\n\r\nfour"}, "", "Content-Length"},
    {"NothingAtAll", {""}, "", "Empty reply"},
    {"OtherProtocol", {"220 mail.example ESMTP\r\n"}, "", "HTTP/0.9"},
    {"HeaderLineWithoutEnd", {"HTTP/1.1 200 OK\r\nX: ", QByteArray(9999, 'x')}, "", "Out of memory"},
    {"HeadersWithoutEnd", {"HTTP/1.1 200 OK\r\n", QByteArray(99, 'x') + ": y\r\n"}, "", "Too large"},
};

class ServerFaults : public testing::TestWithParam<ServerFault>
{
};

TEST_P(ServerFaults, FailTheTransferAndKeepWhatArrived)
{
    const LogCapture log;
    const ScriptedServer server([](const QByteArray&) { return GetParam().reply; });
    KxHttpStatus status;
    EXPECT_EQ(KxCurlClient::instance().readBytes(server.url("x"), status), GetParam().body);
    EXPECT_TRUE(status.failed);
    EXPECT_EQ(log.count(GetParam().reason), 1) << testing::PrintToString(log.lines());
}

INSTANTIATE_TEST_SUITE_P(Net, ServerFaults, testing::ValuesIn(kServerFaults),
                         [](const auto& fault) { return fault.param.name; });

TEST(Addresses, OfOtherProtocolsAreRefused)
{
    KxHttpStatus status;
    EXPECT_EQ(KxCurlClient::instance().readBytes("file:///etc/hostname", status), QByteArray());
    EXPECT_TRUE(status.failed);
}

}  // namespace
