#include "ServedStore.h"
#include "server/dimse/RawCaller.h"

#include <QDirIterator>

#include <random>
#include <set>
#include <thread>

using namespace Kdd;

namespace
{

/// Servers that take objects while they are killed.
class Store : public ServedStore
{
protected:
    static QByteArray uidOf(int number) { return "1.2.3." + QByteArray::number(number); }

    QByteArray objectOf(int number) const
    {
        const QByteArray name = uidOf(number);
        save(name.constData(), anImage(name)
                                   .with(DCM_PatientName, "Doe^J")
                                   .with(DCM_InstanceNumber, QByteArray::number(number))
                                   .withLong(DCM_TextValue, 5000));
        return bytes(name.constData());
    }

    /// Of the one study.
    QByteArray tagFile() const
    {
        QDirIterator files(path("store/meta"), {QStringLiteral("*.tc")}, QDir::Files,
                           QDirIterator::Subdirectories);
        return files.hasNext() ? fileContent(files.next()) : QByteArray("(no tag file)");
    }

    /// Over an association; whether it was told as stored. One that the server did not live to tell about is not.
    static bool sendTo(const QByteArray& address, const QByteArray& object, const QByteArray& uid)
    {
        RawCaller caller(address);
        if (caller.associate({{UID_SecondaryCaptureImageStorage, {UID_LittleEndianExplicitTransferSyntax}}})
                .isEmpty())
            return false;
        const int status = caller.store(UID_SecondaryCaptureImageStorage, uid, datasetOf(object));
        EXPECT_TRUE(status == 0 || status == -1) << status;
        return status == 0;
    }
};

TEST_F(Store, LosesNothingThatItToldWasStoredWhenItIsKilled)
{
    constexpr int kPerRound = 12;
    const QByteArray wanted = qgetenv("KDD_KILL_ROUNDS");
    const int rounds = wanted.isEmpty() ? 6 : wanted.toInt();
    std::mt19937 random(7);
    std::mutex mutex;
    std::set<QByteArray> stored;
    std::set<QByteArray> sent;
    for (int round = 0; round < rounds; ++round) {
        std::vector<QByteArray> objects;
        // Some of the round before come again.
        for (int i = 0; i < kPerRound; ++i)
            objects.push_back(objectOf(round * kPerRound * 2 / 3 + i));
        Addresses addresses;
        const auto server = serve(addresses);
        std::vector<std::thread> senders;
        for (int sender = 0; sender < 4; ++sender) {
            senders.emplace_back([&, sender] {
                for (int i = sender; i < kPerRound; i += 4) {
                    const QByteArray& object = objects[static_cast<std::size_t>(i)];
                    const QByteArray uid = uidOf(round * kPerRound * 2 / 3 + i);
                    const bool isByRequest = sender % 2 == 0;
                    const int status = isByRequest ? send(addresses, object) : 0;
                    EXPECT_TRUE(status == 200 || status == 0) << status;
                    const bool isStored = isByRequest ? status == 200 : sendTo(addresses.dicom, object, uid);
                    const std::lock_guard<std::mutex> lock(mutex);
                    sent.insert(uid);
                    if (isStored)
                        stored.insert(uid);
                }
            });
        }
        // In the last round it comes to its end.
        const bool isKilled = round + 1 < rounds;
        if (isKilled && !server->waitForFinished(static_cast<int>(random() % 250)))
            server->kill();
        for (std::thread& sender : senders)
            sender.join();
        if (!isKilled)
            server->terminate();
        EXPECT_TRUE(server->waitForFinished(kTimeout));
    }
    EXPECT_GE(stored.size(), std::size_t(kPerRound)) << "the last round was whole";
    const Answer built = kdd("build --all --settle");
    EXPECT_EQ(built.exitCode, 0) << built.err.toStdString();
    const Answer verified = kdd("verify --all --json");
    EXPECT_EQ(verified.exitCode, 0) << verified.out.toStdString() << verified.err.toStdString();
    const QByteArray metadata = kdd("metadata 1.2").out;
    for (const QByteArray& uid : sent) {
        const int count = metadata.count("\"Value\":[\"" + uid + "\"]");
        EXPECT_TRUE(count == 1 || (count == 0 && stored.count(uid) == 0)) << uid.constData() << ": " << count;
    }
    // Byte for byte what a build from scratch makes.
    const QByteArray settled = tagFile();
    EXPECT_EQ(kdd("build --all --again").exitCode, 0);
    EXPECT_EQ(tagFile(), settled);
}

}  // namespace
