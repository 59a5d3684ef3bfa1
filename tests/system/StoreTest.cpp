#include "ServedStore.h"

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
        save(name.constData(), anImage(name.constData())
                                   .with(DCM_PatientName, "Doe^J")
                                   .with(DCM_InstanceNumber, QByteArray::number(number).constData())
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
        quint16 port = 0;
        const auto server = serve(port);
        std::vector<std::thread> senders;
        for (int sender = 0; sender < 3; ++sender) {
            senders.emplace_back([&, sender] {
                for (int i = sender; i < kPerRound; i += 3) {
                    const int status = send(port, objects[static_cast<std::size_t>(i)]);
                    const std::lock_guard<std::mutex> lock(mutex);
                    const QByteArray uid = uidOf(round * kPerRound * 2 / 3 + i);
                    sent.insert(uid);
                    if (status == 200)
                        stored.insert(uid);
                    EXPECT_TRUE(status == 200 || status == 0) << status;
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
