#include "server/PeersFile.h"
#include "server/dimse/DimseFixture.h"
#include "server/dimse/PduGuard.h"

#include <QtEndian>

using namespace Kdd;

namespace
{

class AssociationTest : public DimseFixture
{
protected:
    /// "accepted", or of a rejection its result, source and reason; "ended" when there is no answer.
    static std::string answerTo(RawCaller& caller, const QByteArray& called = "KDD",
                                const QByteArray& calling = "TEST")
    {
        const QByteArray answer = caller.associate({{kEcho, {kImplicit}}}, called, calling);
        if (answer.isEmpty())
            return "ended";
        if (answer.at(0) == 2)
            return "accepted";
        return QByteArray(answer.mid(7, 3).toHex()).toStdString();
    }

    static QByteArray echo()
    {
        const QByteArray elements = RawCaller::text(0x0002, kEcho) + RawCaller::number(0x0100, 0x30) +
                                    RawCaller::number(0x0110, 7) + RawCaller::number(0x0800, 0x0101);
        return RawCaller::value(1, 3, elements);
    }
};

TEST_F(AssociationTest, GoesToThoseWhomTheRulesKnowByTitleAndAddress)
{
    PeersFile file;
    const Result read = PeersFile::parse(R"({"peers": {
        "CT1": {"addresses": ["127.0.0.1"], "rights": ["store"]},
        "CT2": {"addresses": ["10.0.0.7"], "rights": ["store"]},
        "WS 1": {"rights": ["query"]}}})",
                                         file);
    ASSERT_TRUE(read.good()) << read.text().toStdString();
    mSettings.dimse->rules = file.rules;
    mSettings.dimse->rules.titles = {"KDD", "ARCHIVE"};
    start();
    const std::tuple<const char*, const char*, const char*> kCallers[] = {
        {"CT1", "KDD", "accepted"}, {"CT1", "ARCHIVE", "accepted"}, {"WS 1", "KDD", "accepted"},
        {"CT1", "KD", "010107"},    {"CT2", "KDD", "010103"},       {"OTHER", "KDD", "010103"},
        {"ct1", "KDD", "010103"}};
    for (const auto& [calling, called, answer] : kCallers) {
        RawCaller raw(mServer->dimseAddress());
        EXPECT_EQ(answerTo(raw, called, calling), answer) << calling;
    }
    for (const char* calling : {"CT1", "WS 1"}) {
        RawCaller raw(mServer->dimseAddress(), {{kCapture, {kExplicit}}, {kEcho, {kImplicit}}}, calling);
        EXPECT_EQ(raw.accepted(),
                  (QVector<QByteArray>{calling[0] == 'C' ? kExplicit : QByteArray("1"), kImplicit}));
    }
}

TEST_F(AssociationTest, IsRejectedForNowWhereThereAreTooMany)
{
    mSettings.dimse->associations = 2;
    start();
    auto first = std::make_unique<RawCaller>(mServer->dimseAddress());
    RawCaller second(mServer->dimseAddress());
    EXPECT_EQ(answerTo(*first), "accepted");
    EXPECT_EQ(answerTo(second), "accepted");
    RawCaller third(mServer->dimseAddress());
    EXPECT_EQ(answerTo(third), "020302");
    first->release();
    // Its place is free when it has gone, which it tells nobody.
    first.reset();
    std::string answer;
    while ((answer = answerTo(*std::make_unique<RawCaller>(mServer->dimseAddress()))) == "020302") {
    }
    EXPECT_EQ(answer, "accepted");
}

TEST_F(AssociationTest, EndsWhenNothingComes)
{
    mSettings.dimse->idle = std::chrono::seconds(1);
    mSettings.dimse->patience = std::chrono::seconds(1);
    start();
    RawCaller silent(mServer->dimseAddress());
    EXPECT_EQ(silent.receive(), "");
    RawCaller half(mServer->dimseAddress());
    half.send(QByteArray("\1\0\0\0\1", 5));
    EXPECT_EQ(half.receive(), "");
    RawCaller resting(mServer->dimseAddress());
    EXPECT_EQ(answerTo(resting), "accepted");
    EXPECT_EQ(resting.receive().left(1), QByteArray(1, 7));
    RawCaller cut(mServer->dimseAddress());
    EXPECT_EQ(answerTo(cut), "accepted");
    cut.send(RawCaller::pdu(4, echo()).left(20));
    EXPECT_EQ(cut.receive().left(1), QByteArray(1, 7)) << "the time of a message";
}

TEST_F(AssociationTest, IsAbortedWhenTheServerStopsAndNoMessageIsUnderWay)
{
    start();
    RawCaller resting(mServer->dimseAddress());
    RawCaller silent(mServer->dimseAddress());
    EXPECT_EQ(answerTo(resting), "accepted");
    mServer.reset();
    EXPECT_EQ(resting.receive().left(1), QByteArray(1, 7));
    EXPECT_EQ(silent.receive(), "");
}

TEST_F(AssociationTest, SurvivesWhatNobodyShouldSend)
{
    const QByteArray request = RawCaller::pdu(1, RawCaller::request({{kCapture, {kExplicit}}}));
    const auto value = [](char control, const QByteArray& bytes) {
        return RawCaller::value(1, control, bytes);
    };
    const auto data = [](const QByteArray& values) { return RawCaller::pdu(4, values); };
    const QByteArray command = value(3, RawCaller::storeCommand(kCapture, "1.2.3.1"));
    QByteArray nested;
    for (int i = 0; i < 1000; ++i)
        nested += QByteArray("\x08\0\x40\x11\xff\xff\xff\xff\xfe\xff\x00\xe0\xff\xff\xff\xff", 16);
    // bytes: behind a request
    const std::pair<const char*, QByteArray> kHostile[] = {
        {"unknown kind of PDU", RawCaller::pdu(9, "abcd")},
        {"second request", request},
        {"PDU larger than agreed", RawCaller::pdu(4, QByteArray(200000, 'x'))},
        {"PDU of four gigabytes", QByteArray("\x04\x00\xff\xff\xff\xff", 6) + QByteArray(1000, 'x')},
        {"PDU without values", RawCaller::pdu(4, "")},
        {"value longer than its PDU", data(QByteArray("\0\0\x40\0\1\3", 6) + "abcd")},
        {"value shorter than its head", data(QByteArray("\0\0\0\1\1\3", 6))},
        {"value of four gigabytes", data(QByteArray("\xff\xff\xff\xff\1\3", 6) + "abcd")},
        {"no room for a second value", data(value(1, "ab") + "abc")},
        {"context that was not offered",
         data(RawCaller::value(9, 3, RawCaller::storeCommand(kCapture, "1")))},
        {"command that is garbage", data(value(3, QByteArray(400, '\x81')))},
        {"command without end", data(value(1, QByteArray(10000, 0))) + data(value(1, QByteArray(10000, 0)))},
        {"command with a thousand levels", data(value(3, nested))},
        {"dataset before a command", data(value(2, "abcd"))},
        {"command within a dataset", data(command) + data(value(0, "ab")) + data(command)},
        {"other context within a dataset", data(command) + data(RawCaller::value(3, 2, "abcd"))},
        {"release of a wrong length", RawCaller::pdu(5, "abcdefgh")},
        {"answer that nobody asked for", data(value(3, RawCaller::number(0x0100, 0x8001)))},
        {"half a message and release", data(command) + RawCaller::pdu(5, QByteArray(4, 0))},
    };
    start();
    for (const auto& [name, bytes] : kHostile) {
        RawCaller caller(mServer->dimseAddress());
        EXPECT_EQ(caller.associate({{kCapture, {kExplicit}}}).left(1), QByteArray(1, 2));
        caller.send(bytes);
        const QByteArray answer = caller.receive();
        EXPECT_TRUE(answer.isEmpty() || answer.at(0) == 7) << name << answer.toHex().constData();
        EXPECT_EQ(store(anImage()), 0) << name;
    }
}

TEST(AssociationRequest, HoldsNotMoreOfAnythingThanThereMayBe)
{
    const auto isTaken = [](int contexts, int syntaxes, int items) {
        QByteArray request = RawCaller::request(
            QVector<RawCaller::Offer>(contexts, {kCapture, QVector<QByteArray>(syntaxes, kExplicit)}));
        // The information about the user stands last, with two items of its own.
        const int user = request.lastIndexOf(QByteArray("\x50\x00", 2));
        request += QByteArray("\x57\0\0\0", 4).repeated(items - 2);
        qToBigEndian(static_cast<quint16>(request.size() - user - 4), request.data() + user + 2);
        return Dimse::isWellFormedRequest(request.constData(), request.size());
    };
    EXPECT_TRUE(isTaken(128, 1, 2));
    EXPECT_FALSE(isTaken(129, 1, 2));
    EXPECT_TRUE(isTaken(1, 50, 2));
    EXPECT_FALSE(isTaken(1, 51, 2));
    EXPECT_TRUE(isTaken(1, 1, 1000));
    EXPECT_FALSE(isTaken(1, 1, 1001));
}

TEST_F(AssociationTest, SurvivesEveryDamagedRequest)
{
    start();
    const QByteArray good =
        RawCaller::pdu(1, RawCaller::request({{kCapture, {kExplicit, kImplicit}}, {kEcho, {kImplicit}}}));
    const auto send = [&](const QByteArray& bytes) {
        RawCaller caller(mServer->dimseAddress());
        caller.send(bytes);
        caller.send(RawCaller::pdu(5, QByteArray(4, 0)));
        caller.receive();
    };
    for (int at = 0; at < good.size(); ++at) {
        for (const char damage : {'\x00', '\xff', '\x41'}) {
            // A longer one would be waited for.
            if (at >= 2 && at < 6)
                continue;
            QByteArray bytes = good;
            bytes[at] = damage;
            send(bytes);
        }
    }
    for (int size = 0; size < good.size() - 6; ++size)
        send(RawCaller::pdu(1, good.mid(6, size)));
    send(RawCaller::pdu(1, QByteArray(100000, 0)));
    send(QByteArray("\x01\x00\xff\xff\xff\xff", 6));
    send("GET / HTTP/1.1\r\nHost: localhost\r\n\r\n");
    EXPECT_EQ(store(anImage()), 0);
}

}  // namespace
