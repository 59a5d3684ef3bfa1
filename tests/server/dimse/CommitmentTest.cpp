#include "server/dimse/DimseFixture.h"
#include "server/dimse/OnlyPatient.h"

#include <gmock/gmock.h>

using namespace Kdd;
using testing::HasSubstr;
using testing::Not;

namespace
{

class CommitmentTest : public DimseFixture
{
protected:
    void fill()
    {
        start();
        for (const char* uid : {"1.2.3.1", "1.2.3.2", "1.2.3.3", "1.2.3.4", "1.2.3.5", "1.2.3.6", "1.2.3.7"})
            ASSERT_EQ(store(anImage(uid).with(DCM_PatientID, "P1"), uid), 0);
    }

    /// What a modality is told that asks for objects, "1.2.3.1" or "CLASS=1.2.3.1"; at a port, when it has left.
    std::string ask(const QByteArray& objects, quint16 at = 0, const QByteArray& title = "CT1") const
    {
        QByteArray arguments = port().toLatin1() + ' ' + title + " 1.9.9 " + QByteArray::number(at);
        for (const QByteArray& object : objects.split(' '))
            arguments += ' ' + (object.contains('=') ? object : kCapture + '=' + object);
        QProcess process;
        process.start(QStringLiteral(COMMITMENT_SCU), words(arguments));
        return finish(process).text.toStdString();
    }

    /// The status of the answer to a request with that dataset, after which nobody waits.
    int askRaw(const QByteArray& dataset, const char* title) const
    {
        const QByteArray sopClass = UID_StorageCommitmentPushModelSOPClass;
        RawCaller caller(mServer->dimseAddress(), {{sopClass, {kImplicit}}}, title);
        caller.send(RawCaller::pdu(4, RawCaller::value(1, 3, RawCaller::actionCommand())));
        constexpr int kPiece = 10000;
        for (int at = 0; at == 0 || at < dataset.size(); at += kPiece)
            caller.send(RawCaller::pdu(
                4, RawCaller::value(1, at + kPiece >= dataset.size() ? 2 : 0, dataset.mid(at, kPiece))));
        const int status = caller.status();
        caller.release();
        return status;
    }

    QString fileOf(const char* uid) const { return storedFiles().filter(QLatin1String(uid)).value(0); }
};

TEST_F(CommitmentTest, TellsOfEachObjectWhetherItIsSafe)
{
    fill();
    const auto database = catalogue();
    QMap<QByteArray, qint64> requests;
    ASSERT_TRUE(database->removeImage("1.2", "1.2.3.2").good());
    ASSERT_TRUE(database
                    ->recordCorrections({{"1.2", "1.2.3.3", "1.7", "1.7.1", "1.2.3.3", "moved"},
                                         {"1.2", "1.2.3.4", "1.2", "1.2.3", "1.8.8", "renamed"}},
                                        requests)
                    .good());
    EXPECT_TRUE(QFile::resize(fileOf("1.2.3.5.dcm"), 500));
    EXPECT_TRUE(QFile::remove(fileOf("1.2.3.6.dcm")));
    const std::string said = ask("1.2.3.1 1.2.3.2 1.2.3.3 1.2.3.4 1.2.3.5 1.2.3.6 "
                                 "1.2.840.10008.5.1.4.1.1.2=1.2.3.7 1.8.8");
    EXPECT_EQ(said, "status 0000\nevent 2 of 1.9.9\n"
                    "1.2.3.1 kept at KDD\n"
                    "1.2.3.3 kept at KDD\n"
                    "1.2.3.4 kept\n"  // which nobody gets by that UID
                    "1.2.3.2 failed 0112\n"
                    "1.2.3.5 failed 0110\n"
                    "1.2.3.6 failed 0112\n"
                    "1.2.3.7 failed 0119\n"
                    "1.8.8 failed 0112\n");
    EXPECT_EQ(ask("1.2.3.1"), "status 0000\nevent 1 of 1.9.9\n1.2.3.1 kept at KDD\n");
}

TEST_F(CommitmentTest, IsBroughtToWhoHasLeft)
{
    const quint16 port = freePort();
    mSettings.dimse->rules.peers.insert("CT1", {{}, "127.0.0.1", port, false, Dimse::Right::Store});
    mSettings.dimse->linger = std::chrono::hours(1);
    fill();
    EXPECT_EQ(ask("1.2.3.1 1.9", port),
              "status 0000\nevent 2 of 1.9.9\n1.2.3.1 kept at KDD\n1.9 failed 0112\n");
}

TEST_F(CommitmentTest, IsTriedUntilTheServerEndsAndThenToldAsLost)
{
    mSettings.dimse->rules.peers.insert("CT1", {{}, "127.0.0.1", freePort(), false, Dimse::Right::Store});
    mSettings.dimse->linger = std::chrono::hours(1);
    fill();
    const DatasetBuilder object =
        anItem().with(DCM_ReferencedSOPClassUID, kCapture).with(DCM_ReferencedSOPInstanceUID, "1.2.3.1");
    const QByteArray asked =
        bytesOf(anItem().with(DCM_TransactionUID, "1.9.9").withItem(DCM_ReferencedSOPSequence, object),
                EXS_LittleEndianImplicit);
    EXPECT_EQ(askRaw(asked, "CT1"), 0);
    EXPECT_EQ(askRaw(asked, "UNCALLED"), 0);
    mServer.reset();
    EXPECT_EQ(mLog.count("\"UNCALLED\" is not told what is committed of its request 1.9.9"), 1);
    EXPECT_EQ(mLog.count("\"CT1\" is not told what is committed of its request 1.9.9: the server stops"), 1);
}

TEST_F(CommitmentTest, RefusesWhatItCannotUnderstand)
{
    fill();
    EXPECT_EQ(ask("1.2.3.1\\1.2.3.2"), "status 0115\n");
    EXPECT_EQ(ask("=1.2.3.1"), "status 0115\n");
    // Sequences inside each other, each of undefined length.
    const QByteArray level("\x08\x00\x99\x11\xff\xff\xff\xff\xfe\xff\x00\xe0\xff\xff\xff\xff", 16);
    const std::pair<QByteArray, int> hostile[] = {
        {level.repeated(100000), 0x0115}, {QByteArray(5000000, '\0'), 0x0115}, {"xx", 0x0115}};
    for (const auto& [dataset, status] : hostile)
        EXPECT_EQ(askRaw(dataset, "CT1"), status) << dataset.size();
    const QByteArray object("\xfe\xff\x00\xe0\x1a\0\0\0"
                            "\x08\0\x50\x11\x04\0\0\0"
                            "1.2\0"
                            "\x08\0\x55\x11\x06\0\0\0"
                            "1.2.3\0",
                            8 + 26);
    const QByteArray before("\x08\0\x95\x11\x04\0\0\0"
                            "1.9\0"
                            "\x08\0\x99\x11\xff\xff\xff\xff",
                            20);
    const QByteArray after("\xfe\xff\xdd\xe0\0\0\0\0", 8);
    EXPECT_EQ(askRaw(before + object.repeated(20000) + after, "CT1"), 0);
    EXPECT_EQ(askRaw(before + object.repeated(20001) + after, "CT1"), 0x0213);
    EXPECT_THAT(ask("1.2.3.1"), HasSubstr("1.2.3.1 kept"));
}

TEST_F(CommitmentTest, IsForThoseWhoMayStoreAndOfWhatTheyMaySee)
{
    mSettings.dimse->rules.peers.insert("READER", {{}, {}, 0, false, Dimse::Right::Query});
    mSettings.dimse->rules.peers.insert("P1", {{}, {}, 0, false, Dimse::kAllRights, onlyPatient("P1")});
    mSettings.dimse->rules.peers.insert("P2", {{}, {}, 0, false, Dimse::kAllRights, onlyPatient("P2")});
    fill();
    const QByteArray all = "1.2.3.1 1.2.840.10008.5.1.4.1.1.2=1.2.3.2";
    EXPECT_THAT(ask(all, 0, "READER"), Not(HasSubstr("status 0000")));
    EXPECT_THAT(ask(all, 0, "P1"), HasSubstr("1.2.3.1 kept at KDD\n1.2.3.2 failed 0119\n"));
    EXPECT_THAT(ask(all, 0, "P2"), HasSubstr("1.2.3.1 failed 0112\n1.2.3.2 failed 0112\n"));
}

}  // namespace
