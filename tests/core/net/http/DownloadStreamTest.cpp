#include "kddlib/net/KxCurlClient.h"
#include "kddlib/net/http/KxCurlDownloadStream.h"
#include "support/HttpServer.h"
#include "support/ObjectServer.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <condition_variable>
#include <mutex>
#include <random>

using namespace Kdd;
using testing::HasSubstr;

namespace
{

/// Everything, in reads of all sizes.
QByteArray readAll(KxCurlDownloadStream& stream)
{
    QByteArray all;
    QByteArray part(90'000, '\0');
    std::minstd_rand random(1);
    const auto isSmall = [&] { return random() % 2 == 0; };
    while (stream.read(part.data(), static_cast<int>(random() % (isSmall() ? 50u : 90'000u)) + 1).gcount() >
           0)
        all.append(part.constData(), static_cast<int>(stream.gcount()));
    return all;
}

class Download : public testing::Test
{
protected:
    ~Download() override { fetchInRanges(1, 12 * 1024 * 1024); }

    void fetchInRanges(int count, int length)
    {
        client.setNumConcurrentRequestsPerFile(count);
        client.setChunkSizeForPartialRequests(length);
    }

    KxCurlClient& client = KxCurlClient::instance();
};

struct Site
{
    const char* name;
    NginxServer::Scheme scheme;
    const char* directives;
    bool tellsLength;
};

const Site kSites[] = {
    {"Ranges", NginxServer::Scheme::Http, "", true},
    {"NoRanges", NginxServer::Scheme::Http, "max_ranges 0;", true},
    {"Http2", NginxServer::Scheme::Http2, "", true},
    {"Chunked", NginxServer::Scheme::Http, "ssi on; ssi_types *;", false},
    {"LimitedRate", NginxServer::Scheme::Http, "limit_rate 8m;", true},
};

TEST_F(Download, GivesEveryByteUntilTheEndWithAnyNumberOfRanges)
{
    for (const Site& site : kSites) {
        SCOPED_TRACE(site.name);
        const NginxServer server(site.scheme, site.directives);
        const QByteArray object = someObject(1'234'567);
        server.addFile("object", object);
        for (const int count : {1, 2, 8}) {
            fetchInRanges(count, 100'000);
            KxCurlDownloadStream stream = client.read(server.url("object"), true);
            EXPECT_EQ(stream.contentLength(), site.tellsLength ? object.size() : 0);
            EXPECT_EQ(readAll(stream), object) << count;
            EXPECT_TRUE(stream.httpStatus().ok());
            EXPECT_FALSE(stream.isOpen());
            KxCurlDownloadStream page = client.read(server.url("absent"), true);
            EXPECT_THAT(readAll(page).toStdString(), HasSubstr("404 Not Found"));
            EXPECT_EQ(page.httpStatus().reason(), "HTTP response code 404");
        }
        fetchInRanges(2, 2000);
        for (const int size : {0, 1, 1999, 2000, 2001, 4000, 4001, 7001}) {
            server.addFile("object", someObject(size));
            KxHttpStatus status;
            EXPECT_EQ(client.readBytes(server.url("object"), status), someObject(size)) << size;
            EXPECT_TRUE(status.ok()) << size;
        }
    }
}

struct AnswerFault
{
    const char* name;
    void (*spoil)(ObjectServer::Answer&);
    const char* reason;
};

const AnswerFault kLaterFaults[] = {
    {"OtherEntityTag", [](auto& a) { a.entityTag = "\"v2\""; }, "has changed"},
    {"OtherTotal", [](auto& a) { a.total = "20001"; }, "has changed"},
    {"UnknownTotal", [](auto& a) { a.total = "*"; }, "has changed"},
    {"WholeObject", [](auto& a) { a.code = 200; }, "code 200"},
    {"ErrorPage", [](auto& a) { a.code = 503; }, "code 503"},
    {"PastTheEnd", [](auto& a) { a.code = 416; }, "code 416"},
    {"RangeIsShifted", [](auto& a) { ++a.first, ++a.last; }, "was asked for"},
    {"RangeIsShorter", [](auto& a) { --a.last, a.body.chop(1); }, "was asked for"},
    {"RangeIsNoRange", [](auto& a) { a.first = a.last + 1; }, "does not say which range"},
    {"BodyIsShort", [](auto& a) { a.body.chop(1); }, "1 bytes early"},
    {"BodyIsLong", [](auto& a) { a.body += 'x'; }, "more than the range"},
    {"BodyIsReset", [](auto& a) { a.body.chop(9), a.resets = true; }, ""},
};

TEST_F(Download, FailsWithALaterRangeWithoutAByteThatIsNotTheObjects)
{
    constexpr int kFaultyAt = 6000;
    const QByteArray object = someObject(20'000);
    for (const AnswerFault& fault : kLaterFaults) {
        SCOPED_TRACE(fault.name);
        const ObjectServer server(object, [&](ObjectServer::Answer& answer) {
            if (answer.first == kFaultyAt)
                fault.spoil(answer);
        });
        fetchInRanges(3, 2000);
        KxCurlDownloadStream stream = client.read(server.url(), true);
        const QByteArray got = readAll(stream);
        EXPECT_GE(got.size(), kFaultyAt);
        EXPECT_LT(got.size(), object.size());
        EXPECT_TRUE(object.startsWith(got));
        EXPECT_TRUE(stream.httpStatus().failed);
        EXPECT_THAT(stream.failure(), HasSubstr(fault.reason));
    }
}

/// The last is the reason where the reading began midway.
const AnswerFault kWithoutRanges[] = {
    {"UnknownTotal", [](auto& a) { a.total = "*"; }, "does not say how long"},
    {"NothingInRange", [](auto& a) { a.code = 416; }, ""},
};

TEST_F(Download, AsksForTheWholeWhereNoRangesCanBePlannedUnlessItBeganMidway)
{
    const QByteArray object = someObject(20'000);
    for (const AnswerFault& answer : kWithoutRanges) {
        SCOPED_TRACE(answer.name);
        const ObjectServer server(object, answer.spoil);
        fetchInRanges(3, 2000);
        KxCurlDownloadStream whole = client.read(server.url(), true);
        EXPECT_EQ(readAll(whole), object);
        EXPECT_TRUE(whole.httpStatus().ok());
        EXPECT_EQ(server.requests().size(), 2U);
        KxCurlDownloadStream rest = client.readFrom(server.url(), 5000);
        readAll(rest);
        EXPECT_FALSE(rest.httpStatus().ok());
        EXPECT_THAT(rest.failure(), HasSubstr(answer.reason));
    }
}

TEST_F(Download, NeverGivesAWrongByteWhateverFaultsComeTogether)
{
    const QByteArray object = someObject(50'000);
    std::minstd_rand random(7);
    std::mutex mutex;
    const ObjectServer server(object, [&](ObjectServer::Answer& answer) {
        const std::lock_guard lock(mutex);
        if (random() % 20 == 0)
            kLaterFaults[random() % std::size(kLaterFaults)].spoil(answer);
        // Of a part that a server calls the whole nobody can tell that it is none.
        if (answer.first == 0 && answer.code == 200)
            answer.code = 500;
    });
    int complete = 0;
    for (int run = 0; run < 60; ++run) {
        fetchInRanges(2 + run % 6, 1500 + 300 * run);
        KxCurlDownloadStream stream = client.read(server.url(), true);
        const QByteArray got = readAll(stream);
        const KxHttpStatus status = stream.httpStatus();
        EXPECT_EQ(status.ok(), got == object) << run;
        EXPECT_TRUE(object.startsWith(got) || status.code / 100 != 2) << run;
        complete += status.ok() ? 1 : 0;
    }
    EXPECT_GT(complete, 6);
    EXPECT_LT(complete, 54);
}

TEST_F(Download, HasAsManyRequestsUnderWayAsItMay)
{
    std::mutex mutex;
    std::condition_variable changed;
    int underWay = 0;
    const QByteArray object = someObject(8000);
    const ObjectServer server(object, [&](ObjectServer::Answer& answer) {
        std::unique_lock lock(mutex);
        underWay += answer.first > 0 ? 1 : 0;
        changed.notify_all();
        const auto areAllThere = [&] { return answer.first == 0 || underWay >= 3; };
        if (!changed.wait_for(lock, std::chrono::seconds(20), areAllThere))
            answer.code = 503;
    });
    fetchInRanges(3, 2000);  // the first, and three of which one takes its place
    KxCurlDownloadStream stream = client.read(server.url(), true);
    EXPECT_EQ(readAll(stream), object);
    EXPECT_TRUE(stream.httpStatus().ok());
}

TEST_F(Download, KeepsTheCallersRange)
{
    fetchInRanges(4, 2000);  // which is for whole objects
    const QByteArray object = someObject(20'000);
    const NginxServer nginx;
    nginx.addFile("object", object);
    const std::pair<const char*, QByteArray> ranges[] = {
        {"5-9000", object.mid(5, 8996)},
        {"19990-", object.mid(19'990)},
        {"-7", object.right(7)},
        {"19990-30000", object.mid(19'990)},
        {"-30000", object},
        {"0-", object},
    };
    for (const auto& [range, expected] : ranges) {
        KxCurlDownloadStream stream = client.readRange(nginx.url("object"), range, true);
        EXPECT_EQ(readAll(stream), expected) << range;
        EXPECT_TRUE(stream.httpStatus().ok()) << range;
        EXPECT_EQ(stream.contentLength(), object.size());
    }
    KxCurlDownloadStream rest = client.readFrom(nginx.url("object"), 3000);
    EXPECT_EQ(readAll(rest), object.mid(3000));
    KxCurlDownloadStream none = client.readRange(nginx.url("object"), "20000-", true);
    EXPECT_EQ(none.httpStatus().code, 416);
}

TEST_F(Download, FailsWhenTheServerSendsTheWholeForARange)
{
    const NginxServer nginx(NginxServer::Scheme::Http, "max_ranges 0;");
    nginx.addFile("object", someObject(20'000));
    for (const int count : {1, 4}) {
        fetchInRanges(count, 2000);
        KxCurlDownloadStream streams[] = {client.readRange(nginx.url("object"), "5-9", true),
                                          client.readFrom(nginx.url("object"), 5)};
        for (KxCurlDownloadStream& stream : streams) {
            EXPECT_EQ(readAll(stream), QByteArray());
            EXPECT_THAT(stream.failure(), HasSubstr("whole object"));
        }
    }
}

TEST_F(Download, CanBeMovedAndBrokenOffAtAnyPlace)
{
    const QByteArray object = someObject(3'000'000);
    const NginxServer nginx;
    nginx.addFile("object", object);
    fetchInRanges(3, 300'000);
    KxCurlDownloadStream kept(nullptr);
    EXPECT_EQ(kept.get(), EOF);
    for (const int size : {1, 40'000, 700'000}) {
        QByteArray part(size, '\0');
        KxCurlDownloadStream stream = client.read(nginx.url("object"), true);
        stream.read(part.data(), size);
        EXPECT_EQ(part, object.left(size));
        kept = std::move(stream);  // which ends the one before
        EXPECT_FALSE(stream.isOpen());
    }
    EXPECT_EQ(kept.get(), static_cast<unsigned char>(object.at(700'000)));
    kept.close();
    EXPECT_FALSE(kept.isOpen());
    EXPECT_EQ(kept.httpStatus().code, 206);
    EXPECT_EQ(kept.get(), EOF);
}

}  // namespace
