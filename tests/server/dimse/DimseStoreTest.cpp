#include "server/dimse/DimseFixture.h"
#include "server/dimse/OnlyPatient.h"
#include "support/FileContent.h"

#include <thread>

using namespace Kdd;

namespace
{

class DimseStore : public DimseFixture
{
protected:
    /// Whether there is a file that is not whole.
    bool isReceiving() const
    {
        return !filesBelow(mStore.filePath("objects/.incoming"), {QStringLiteral("1")}).isEmpty();
    }

    /// What is left of the only file behind its meta information.
    QByteArray datasetStored() const
    {
        const QStringList files = storedFiles();
        return files.size() == 1 ? datasetOf(fileContent(files.first())) : QByteArray();
    }
};

TEST_F(DimseStore, ShowsWhatItToldWasStoredInTheNextAnswer)
{
    start();
    EXPECT_EQ(run("echoscu").exitCode, 0);
    for (int i = 1; i <= 4; ++i) {
        const QByteArray uid = "1.2.3." + QByteArray::number(i);
        const QString file = save(anImage(uid).with(DCM_PatientName, "Doe^J"), "sent.dcm");
        const Said said = run(i % 2 == 0 ? "storescu" : "dcmsend", {}, {file});
        EXPECT_EQ(said.exitCode, 0) << said.text.constData();
        EXPECT_EQ(instances(), i);
        EXPECT_EQ(get("/studies/1.2/series/1.2.3/instances/" + uid + "/metadata").status, 200);
    }
    EXPECT_TRUE(get("/studies?PatientName=doe*").body.contains("\"1.2\""));
    for (const std::string& line : mLog.lines())
        EXPECT_EQ(line.find("Doe"), std::string::npos) << line;
}

TEST_F(DimseStore, KeepsTheBytesOfADatasetHoweverTheyComeInPieces)
{
    const DatasetBuilder image = anImage().with(DCM_PatientName, "Doe^J").words(std::vector<Uint16>(5000, 7));
    const std::pair<QByteArray, E_TransferSyntax> kForms[] = {
        {kExplicit, EXS_LittleEndianExplicit},
        {kImplicit, EXS_LittleEndianImplicit},
        {UID_BigEndianExplicitTransferSyntax, EXS_BigEndianExplicit}};
    for (const auto& [uid, syntax] : kForms) {
        for (const int piece : {2, 1000, 100000}) {
            QDir(mStore.filePath("objects")).removeRecursively();
            Kxg::SetDatabaseServer(mDatabase + uid + QByteArray::number(piece));
            start();
            RawCaller caller(mServer->dimseAddress(), {{kCapture, {uid}}});
            const QByteArray sent = bytesOf(image, syntax);
            EXPECT_EQ(caller.store(kCapture, "1.2.3.1", sent, 1, piece), 0);
            caller.release();
            EXPECT_EQ(datasetStored(), sent) << uid.constData() << ' ' << piece;
        }
    }
}

TEST_F(DimseStore, TellsByTheStatusWhatBecameOfAnObject)
{
    mSettings.objects->objectBytes = 50000;
    start();
    EXPECT_EQ(store(anImage()), 0);
    EXPECT_EQ(store(anImage()), 0) << "the same again";
    EXPECT_EQ(store(anImage().with(DCM_PatientName, "Other")), 0x0111);
    EXPECT_EQ(store(anImage("1.2.3.2"), "1.2.3.9"), 0xA900);
    EXPECT_EQ(store(anImage("1.2.3.2"), "1.2.3.2", UID_CTImageStorage), 0xA900);
    EXPECT_EQ(store(anImage("1.2.3.2").inStudy(""), "1.2.3.2"), 0xC000);
    EXPECT_EQ(store(anImage("../../x"), "../../x"), 0xC000);
    EXPECT_EQ(store(anImage("1.2.3.2").words(std::vector<Uint16>(30000, 7)), "1.2.3.2"), 0xA700);
    RawCaller caller(mServer->dimseAddress(), {{kCapture, {kExplicit}}});
    EXPECT_EQ(caller.store(kCapture, "1.2.3.2", QByteArray(3000, 'x')), 0xC000);
    EXPECT_EQ(caller.store(UID_CTImageStorage, "1.2.3.2", bytesOf(anImage("1.2.3.2"))), 0x0122);
    EXPECT_EQ(caller.store(kCapture, "1.2.3.2", bytesOf(anImage("1.2.3.2"))), 0) << "the association goes on";
    EXPECT_EQ(instances(), 2);
    EXPECT_EQ(storedFiles().size(), 2);
}

TEST_F(DimseStore, TakesOfALimitedPeerWhatItMaySee)
{
    mSettings.dimse->rules.peers.insert("LIMITED", {{}, {}, 0, false, Dimse::kAllRights, onlyPatient("P1")});
    start();
    ASSERT_EQ(store(anImage().inStudy("1.9").with(DCM_PatientID, "P2")), 0);
    ASSERT_EQ(instances("1.9"), 1) << "it is complete, and so known as that patient's";
    RawCaller caller(mServer->dimseAddress(), {{kCapture, {kExplicit}}}, "LIMITED");
    const auto send = [&](const char* uid, const char* study, const char* patient) {
        const DatasetBuilder image = anImage(uid).inStudy(study).with(DCM_PatientID, patient);
        return caller.store(kCapture, uid, bytesOf(image));
    };
    EXPECT_EQ(send("1.2.3.2", "1.2", "P1"), 0);
    EXPECT_EQ(send("1.2.3.3", "1.2", "P2"), 0x0124);
    EXPECT_EQ(send("1.2.3.4", "1.9", "P1"), 0x0124) << "it would join a study that it may not see";
    EXPECT_EQ(send("1.2.3.1", "1.9", "P2"), 0x0124) << "nor is it told that this is there";
    EXPECT_EQ(storedFiles().size(), 2);
}

TEST_F(DimseStore, TakesNothingBelowTheWatermarkOfTheDisk)
{
    mSettings.objects->freeBytes = qint64(1) << 60;
    start();
    EXPECT_EQ(store(anImage()), 0xA700);
    const Said said = run("storescu", {}, {save(anImage(), "sent.dcm")});
    EXPECT_TRUE(said.text.contains("Refused: OutOfResources")) << said.text.constData();
    EXPECT_EQ(storedFiles().size(), 0);
}

TEST_F(DimseStore, TakesObjectsOfClassesThatNoTableKnows)
{
    const QByteArray kPrivate = "1.2.826.0.1.3680043.2.1545.77";
    const QByteArray kNewer = "1.2.840.10008.5.1.4.1.1.999.1";
    const QByteArray kPrinting = UID_BasicFilmSessionSOPClass;
    for (const bool isTaken : {true, false}) {
        mSettings.dimse->rules.takesUnknownClasses = isTaken;
        start();
        RawCaller caller(mServer->dimseAddress(),
                         {{kPrivate, {kExplicit}}, {kNewer, {kExplicit}}, {kPrinting, {kExplicit}}});
        EXPECT_EQ(caller.accepted(),
                  (QVector<QByteArray>{isTaken ? kExplicit : QByteArray("3"), kExplicit, "3"}));
        const DatasetBuilder image = anImage(isTaken ? "1.2.3.1" : "1.2.3.2").with(DCM_SOPClassUID, kNewer);
        EXPECT_EQ(caller.store(kNewer, isTaken ? "1.2.3.1" : "1.2.3.2", bytesOf(image), 3), 0);
    }
    EXPECT_EQ(instances(), 2);
}

TEST_F(DimseStore, ChoosesTheFormThatTheSenderNamesFirst)
{
    const QByteArray kJpeg = UID_JPEGProcess14SV1TransferSyntax;
    const QByteArray kBig = UID_BigEndianExplicitTransferSyntax;
    start();
    RawCaller caller(mServer->dimseAddress());
    caller.associate({{kCapture, {kJpeg, kExplicit}},
                      {kCapture, {kImplicit, kExplicit}},
                      {kCapture, {kBig, kImplicit}},
                      {kCapture, {"1.2.3.4.5", kImplicit}},
                      {kCapture, {"1.2.3.4.5"}},
                      {kEcho, {kImplicit, kExplicit}}});
    EXPECT_EQ(caller.accepted(),
              (QVector<QByteArray>{kJpeg, kExplicit, kImplicit, kImplicit, "4", kExplicit}));
}

TEST_F(DimseStore, StoresWhatManySendAtOnceAndNothingTwice)
{
    start();
    std::vector<std::unique_ptr<QProcess>> senders;
    QStringList files;
    for (int i = 1; i <= 40; ++i) {
        const QByteArray uid = "1.2.3." + QByteArray::number(i);
        files.append(save(anImage(uid), (uid + ".dcm").constData()));
    }
    // Each sends half of them, which another one sends too.
    for (int i = 0; i < 8; ++i)
        senders.push_back(begin(i % 2 == 0 ? "storescu" : "dcmsend", "", files.mid(i * 5 % 40, 20)));
    for (const auto& sender : senders) {
        const Said said = finish(*sender);
        EXPECT_EQ(said.exitCode, 0) << said.text.constData();
    }
    EXPECT_EQ(instances(), 40);
    EXPECT_EQ(storedFiles().size(), 40);
}

TEST_F(DimseStore, KeepsNothingOfAnObjectThatDoesNotComeWhole)
{
    start();
    const QByteArray sent = bytesOf(anImage().words(std::vector<Uint16>(5000, 7)));
    {
        RawCaller caller(mServer->dimseAddress(), {{kCapture, {kExplicit}}});
        caller.send(RawCaller::pdu(4, RawCaller::value(1, 3, RawCaller::storeCommand(kCapture, "1.2.3.1"))));
        caller.send(RawCaller::pdu(4, RawCaller::value(1, 0, sent.left(5000))));
        while (!isReceiving())
            std::this_thread::yield();
    }
    mServer.reset();
    EXPECT_EQ(mLog.count("what it sent is lost"), 1);
    EXPECT_EQ(storedFiles().size(), 0);
    EXPECT_FALSE(isReceiving());
}

}  // namespace
