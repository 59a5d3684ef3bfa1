#include "kddlib/net/cloud/Crc32c.h"
#include "kddlib/net/cloud/KxCurlUploadStream.h"
#include "kddlib/net/cloud/KxCurlUploadStreambuf.h"
#include "kddlib/net/http/CurlShare.h"
#include "support/CloudStore.h"
#include "support/LogCapture.h"
#include "support/ObjectServer.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <random>

using namespace Kdd;
using std::chrono::milliseconds;
using Fault = CloudStore::Fault;
using testing::HasSubstr;

namespace
{

constexpr int kStep = KxCurlUploadSession::kGranularity;
constexpr int kAll = INT_MAX;

const Fault kNone = {};
const Fault kUnavailable = {0, "503 Busy"};
const Fault kReset = {0, {}, true};
const Fault kLostAnswer = {kAll, {}, true};

class Upload : public testing::Test
{
protected:
    ~Upload() override { EXPECT_THAT(store.complaints(), testing::IsEmpty()); }

    KxCurlUploadStream open() { return open(store.url("b/o")); }

    KxCurlUploadStream open(const std::string& url)
    {
        auto session = std::make_unique<KxCurlUploadSession>(
            factory, share, UploadTarget{url, [this] { return authorization(); }},
            [this](milliseconds delay) { waits.push_back(delay); });
        return KxCurlUploadStream(std::make_unique<KxCurlUploadStreambuf>(std::move(session), capacity));
    }

    static void write(KxCurlUploadStream& stream, const QByteArray& bytes)
    {
        stream.write(bytes.constData(), bytes.size());
    }

    /// Why it failed; empty when it says that it did not.
    std::string upload(const QByteArray& bytes) { return upload(bytes, store.url("b/o")); }

    std::string upload(const QByteArray& bytes, const std::string& url)
    {
        try {
            KxCurlUploadStream stream = open(url);
            for (int at = 0, count = 0; at < bytes.size(); at += count) {
                count = qMin(pieceSize(), bytes.size() - at);
                write(stream, bytes.mid(at, count));
                if (flushes())
                    stream.flush();
            }
            stream.close();
            EXPECT_EQ(stream.good(), stream.error().empty());
            return stream.error();
        } catch (const std::runtime_error& error) {
            return error.what();
        }
    }

    int capacity = 2 * kStep;
    std::function<int()> pieceSize = [] { return INT_MAX; };
    std::function<bool()> flushes = [] { return false; };
    std::function<std::string()> authorization = [] { return "Authorization: Bearer t"; };
    CloudStore store;
    CurlShare share{CurlShare::Connections::PerHandle};
    std::shared_ptr<KxCurlHandleFactory> factory = std::make_shared<KxCurlHandleFactory>(1);
    std::vector<milliseconds> waits;
    LogCapture log;
};

TEST(Crc32c, IsThatOfTheStandardAndMayBeContinued)
{
    EXPECT_EQ(crc32c("123456789"), 0xE3069283U);
    EXPECT_EQ(crc32c(QByteArray(32, '\xFF')), 0x62A8AB43U);
    const QByteArray bytes = someObject(100);
    for (int i = 0; i <= bytes.size(); ++i)
        EXPECT_EQ(crc32c(bytes.mid(i), crc32c(bytes.left(i))), crc32c(bytes));
}

TEST(RetryPolicy, WaitsTwiceAsLongEachTimeAndGivesUpAfterFiveFailures)
{
    RetryPolicy policy;
    for (const int seconds : {1, 2, 4, 8}) {
        EXPECT_FALSE(policy.exhausted());
        const milliseconds delay = policy.nextDelay();
        EXPECT_GE(delay, milliseconds(seconds * 1000));
        EXPECT_LE(delay, milliseconds(seconds * 1000 + 1000));
    }
    EXPECT_EQ(policy.nextDelay(), milliseconds(0));
    EXPECT_TRUE(policy.exhausted());
}

TEST_F(Upload, GoesOnWithTheStreamThatItWasMovedTo)
{
    KxCurlUploadStream first = open();
    write(first, "one ");
    KxCurlUploadStream second = std::move(first);
    EXPECT_TRUE(!first.isOpen() && first.bad());
    first << "lost";
    second << "two";
    {
        const KxCurlUploadStream closedByItsEnd = std::move(second);
    }
    EXPECT_EQ(store.object("b/o"), "one two");
}

TEST_F(Upload, MakesNoObjectWhenItIsAbandonedOrAPartWasLost)
{
    KxCurlUploadStream stream = open();
    write(stream, someObject(kStep));
    stream.abandon();
    EXPECT_FALSE(stream.isOpen());
    KxCurlUploadStream other = open();
    store.misbehave({{0, "404 Gone"}});
    write(other, someObject(kStep));
    other.flush();
    EXPECT_TRUE(other.bad());
    other.clear();
    write(other, "the end");
    other.close();
    EXPECT_TRUE(other.fail());
    EXPECT_EQ(store.object("b/o"), QByteArray());
    EXPECT_EQ(store.requests().size(), 3U);
}

struct Trouble
{
    const char* name;
    std::vector<Fault> faults;  // by request: the start, 512 KiB, the last 100
    size_t waits;
    const char* error = "";  // empty: the upload heals
};

/// After the start and the first chunk.
std::vector<Fault> atTheEnd(const QByteArray& answer)
{
    return {kNone, kNone, {kAll, answer}};
}

constexpr char kNoUse[] = "indicates that this upload session failed and can not be recovered from.";
constexpr char kChunkExhausted[] = "Retry policy exhausted in KxCurlUploadSession::uploadChunk().";
constexpr char kResetExhausted[] = "Retry policy exhausted in KxCurlUploadSession::resetSession().";

/// A chunk and a query in turn.
std::vector<Fault> forEver(const Fault& fault)
{
    std::vector<Fault> faults(200, fault);
    faults.front() = kNone;
    return faults;
}

const Trouble kTroubles[] = {
    {"StartFailsFourTimes", {kReset, kUnavailable, kReset, {0, "200 OK"}}, 4},
    {"ChunkIsTakenInParts", {kNone, {kStep}, {100}}, 0},
    {"PositionAskedForInVain", {kNone, kLostAnswer, kUnavailable, kReset}, 3},
    {"AnswerToTheLastIsLost", {kNone, kNone, kLostAnswer}, 1},
    {"LastIsStoredButNotEnded", {kNone, kNone, {100}}, 0},
    {"OtherAddressOnTheWay", {kNone, {kAll, "308 Go on\r\nRange: bytes=0-524287\r\nLocation: /upload0"}}, 0},
    {"Forbidden", {{0, "403 Forbidden"}}, 0, "HTTP code 403indicates"},
    {"NeverReached", std::vector<Fault>(9, kReset), 4, kChunkExhausted},
    {"NoAddress", {{0, "201 Created"}}, 0, "does not name the upload session"},
    {"AddressOfAFile", {{0, "201 Created\r\nLocation: file:///etc/passwd"}}, 0, "file:///etc/passwd"},
    {"SessionExpired", {kNone, {kStep, "404 Not Found"}}, 0, kNoUse},
    {"SessionGone", forEver({0, "410 Gone"}), 4, kResetExhausted},
    {"AlwaysReset", forEver(kReset), 4, kResetExhausted},
    {"NothingEverTaken", forEver({0}), 4, kChunkExhausted},
    {"RunsFarAhead", {kNone, {kStep, "308 Go on\r\nRange: bytes=0-18446744073709551615"}}, 0, "claims"},
    {"NoNumber", {kNone, {kStep, "308 Go on\r\nRange: bytes=0-99 "}}, 0, "claims"},
    {"GoesBack", {kNone, {kStep}, {0, "308 Go on\r\nRange: bytes=0-99"}}, 0, "after 262144 bytes"},
    {"LosesAChunk", {kNone, kNone, {0, "308 Go on\r\nRange: bytes=0-99"}}, 0, "after 524288 bytes"},
    {"EndsBeforeTheLast", {kNone, {kStep, "200 OK"}}, 0, "ended the upload before the last"},
    {"OtherMd5", atTheEnd("200 OK\r\nx-goog-hash: crc32c=b+GY5g==,md5=1B2M2Y8AsgTpgAmY7PhCfg=="), 0,
     "md5 1B2M"},
    {"OtherCrc", atTheEnd("200 OK\r\nx-goog-hash: crc32c=AAAAAA=="), 0, "crc32c AAAAAA== instead of "},
    {"OtherLength", atTheEnd("200 OK\r\nx-goog-stored-content-length: 5"), 0, "length 5 instead of 524388"},
};

TEST_F(Upload, EitherLosesNothingOrSaysWhyItEnded)
{
    const QByteArray bytes = someObject(2 * kStep + 100);
    for (const Trouble& trouble : kTroubles) {
        SCOPED_TRACE(trouble.name);
        CloudStore stage;
        stage.misbehave(trouble.faults);
        waits.clear();
        const std::string error = upload(bytes, stage.url("b/o"));
        EXPECT_THAT(error, HasSubstr(trouble.error));
        EXPECT_EQ(error.empty(), trouble.error[0] == '\0');
        EXPECT_TRUE(!error.empty() || stage.object("b/o") == bytes);
        EXPECT_EQ(waits.size(), trouble.waits);
        EXPECT_THAT(stage.complaints(), testing::IsEmpty());
    }
}

TEST_F(Upload, TriesAgainWhenThereIsNoTokenForAMoment)
{
    int asked = 0;
    authorization = [&] { return ++asked == 2 ? "" : "Authorization: Bearer t"; };
    EXPECT_EQ(upload("bytes"), "");
    EXPECT_EQ(store.object("b/o"), "bytes");
    EXPECT_EQ(waits.size(), 1U);
    for (const QByteArray& sent : store.requests())
        EXPECT_EQ(headerOf(sent, "Authorization"), "Bearer t");
}

TEST_F(Upload, KeepsTheAuthorizationFromOtherHosts)
{
    const ScriptedServer other(httpResponse({}));
    store.misbehave({{0, "201 Created\r\nLocation: " + QByteArray::fromStdString(other.url("s"))}});
    EXPECT_EQ(upload("bytes"), "");
    EXPECT_TRUE(other.requests().at(0).endsWith("\r\n\r\nbytes"));
    EXPECT_FALSE(other.requests().at(0).contains("Authorization"));
    EXPECT_EQ("http://" + headerOf(other.requests().at(0), "Host") + '/', other.url("").c_str());
    const NginxServer secure(NginxServer::Scheme::Https,
                             "location / { add_header Location http://127.0.0.1:1/s; return 201; }");
    EXPECT_THAT(upload("bytes", secure.url("b/o")), HasSubstr("http://127.0.0.1:1/s")) << "from HTTPS";
}

/// Faults that an upload may meet, few of them beyond healing.
Fault randomFault(std::mt19937& engine)
{
    const char* const kAnswers[] = {"", "", "", "503 Busy", "429 Slow down", "308 Go on", "500 Oops"};
    const char* const kFatalAnswers[] = {"404 Gone", "308 Go on\r\nRange: bytes=0-99999999",
                                         "200 OK\r\nx-goog-hash: md5=AAAAAAAAAAAAAAAAAAAAAA=="};
    const int kTakes[] = {0, static_cast<int>(engine() % (3 * kStep)), kAll, kAll};
    const char* const answer = engine() % 60 == 0 ? kFatalAnswers[engine() % 3] : kAnswers[engine() % 7];
    return {kTakes[engine() % 4], answer, engine() % 6 == 0};
}

TEST_F(Upload, IsWholeWheneverItSaysSo)
{
    std::mt19937 engine{1};
    pieceSize = [&] { return static_cast<int>(1 + engine() % (2 * kStep)); };
    flushes = [&] { return engine() % 4 == 0; };
    int complete = 0;
    for (int run = 0; run < 40; ++run) {
        CloudStore stage;
        capacity = kStep * static_cast<int>(1 + engine() % 3);
        const QByteArray bytes = someObject(static_cast<int>(engine() % (5 * kStep)));
        std::vector<Fault> faults(engine() % 20);
        std::generate(faults.begin(), faults.end(), [&] { return randomFault(engine); });
        stage.misbehave(faults);
        const std::string error = upload(bytes, stage.url("b/o"));
        EXPECT_THAT(stage.complaints(), testing::IsEmpty()) << run;
        EXPECT_TRUE(!error.empty() || stage.object("b/o") == bytes) << run;
        complete += error.empty() ? 1 : 0;
    }
    EXPECT_GT(complete, 10);
    EXPECT_LT(complete, 39);
}

}  // namespace
