#include "server/dimse/RawCaller.h"
#include "server/faults/Served.h"

#include <dcmtk/dcmdata/dcuid.h>
#include <sys/statvfs.h>

using namespace Kdd;

namespace
{

const QByteArray kCapture = UID_SecondaryCaptureImageStorage;

/// A server whose store has a small file system of its own, which nobody else sees.
class FullDisk : public Served
{
protected:
    void SetUp() override
    {
        Served::SetUp();
        QProcess probe;
        probe.start(QStringLiteral("unshare"), {QStringLiteral("-rm"), QStringLiteral("true")});
        if (!probe.waitForFinished(kTimeout) || probe.exitCode() != 0)
            GTEST_SKIP() << "the system gives no file systems of one's own";
        putFile(path("mounted"),
                "#!/bin/sh\nmount -t tmpfs -o size=16m none " + path("store").toUtf8() + " && exec \"$@\"\n");
        QFile::setPermissions(path("mounted"), QFile::ReadOwner | QFile::WriteOwner | QFile::ExeOwner);
        QDir().mkpath(path("store"));
        serve("--stow --corrections --deletions --dicom 127.0.0.1:0", "",
              "unshare -rm " + path("mounted").toUtf8());
    }

    /// Below the server's own disk.
    QString onDisk(const char* name) const
    {
        return QStringLiteral("/proc/%1/root").arg(mServer->processId()) + path("store/") +
               QLatin1String(name);
    }

    /// Leaves so many bytes.
    void fill(qint64 left)
    {
        struct statvfs disk = {};
        ASSERT_EQ(::statvfs(onDisk("").toUtf8().constData(), &disk), 0);
        QFile ballast(onDisk("ballast"));
        ASSERT_TRUE(ballast.open(QIODevice::WriteOnly | QIODevice::Append | QIODevice::Unbuffered));
        const qint64 free = static_cast<qint64>(disk.f_bavail * disk.f_bsize);
        ballast.write(QByteArray(static_cast<int>(std::max<qint64>(0, free - left)), 'b'));
    }
    void giveRoom() const { QFile::remove(onDisk("ballast")); }

    QByteArray fileOf(const QByteArray& uid, int words)
    {
        save(uid.constData(), anImage(uid).words(std::vector<Uint16>(std::size_t(words), 7)));
        return fileContent(file(uid.constData()));
    }

    int stow(const QByteArray& content) const
    {
        return ask("POST", "studies", "application/dicom", content).status;
    }

    int correct(const QByteArray& value) const
    {
        return ask("POST", "studies/1.2/corrections?all=true", "application/json",
                   "{\"tags\": [{\"tag\": \"00102000\", \"value\": \"" + value + "\"}]}")
            .status;
    }

    int remove(const QByteArray& uid) const
    {
        return ask("DELETE", "studies/1.2/series/1.2.3/instances/" + uid, "text/plain", {}).status;
    }

    int associate(const QByteArray& uid, const QByteArray& content) const
    {
        RawCaller caller(mDicom, {{kCapture, {UID_LittleEndianExplicitTransferSyntax}}});
        return caller.store(kCapture, uid, datasetOf(content));
    }

    bool isShown(const QByteArray& word) const { return get("studies/1.2/metadata").body.contains(word); }

    int found() const { return jsonAt(get("studies/1.2/instances").body).toArray().size(); }

    const Setting mWatermark{"KDD_FREE_SPACE", "0"};
};

TEST_F(FullDisk, RefusesAnObjectForWhichThereIsNoRoomAndGoesOnWhenThereIs)
{
    const QByteArray large = fileOf("1.2.3.1", 500000);
    EXPECT_EQ(stow(fileOf("1.2.3.2", 4)), 200);
    const QStringList before = filesBelow(onDisk("objects"));
    fill(400000);
    for (int i = 0; i < 3; ++i) {
        EXPECT_EQ(stow(large), 503);
        EXPECT_EQ(associate("1.2.3.1", large), 0xA700);
        EXPECT_EQ(filesBelow(onDisk("objects")), before) << "nothing of it is left";
    }
    EXPECT_EQ(found(), 1);
    giveRoom();
    EXPECT_EQ(associate("1.2.3.1", large), 0);
    EXPECT_EQ(stow(large), 200) << "which is there";
    EXPECT_EQ(found(), 2);
    EXPECT_EQ(end(), 0);
}

TEST_F(FullDisk, TellsTheTruthWhereverTheRoomEnds)
{
    int stored = 0;
    for (int i = 0; i < 24; ++i) {
        fill(4096 * (i / 2));
        const QByteArray uid = "1.2.3." + QByteArray::number(100 + i);
        const QByteArray content = fileOf(uid, 3000);
        const bool isTold = i % 2 == 0 ? stow(content) == 200 : associate(uid, content) == 0;
        giveRoom();
        EXPECT_EQ(found(), stored + (isTold ? 1 : 0)) << i;
        EXPECT_EQ(i % 2 == 0 ? stow(content) : associate(uid, content), i % 2 == 0 ? 200 : 0) << i;
        EXPECT_EQ(found(), ++stored) << i;
    }
    EXPECT_EQ(end(), 0);
}

/// What succeeded is shown at once, what is kept as soon as there is room, what failed never.
TEST_F(FullDisk, TellsOfChangesWhatBecomesOfThem)
{
    const QByteArray words(9000, 'x');
    constexpr int kRounds = 24;
    const auto uidOf = [](int i) { return "1.2.3." + QByteArray::number(100 + i); };
    for (int i = 0; i <= kRounds; ++i)
        ASSERT_EQ(stow(fileOf(uidOf(i), 30)), 200);
    QMap<int, int> corrections;  // how often each status was the answer
    QMap<int, int> removals;
    for (int i = 0; i < kRounds; ++i) {
        const QByteArray word = "word" + QByteArray::number(i) + '.';
        fill(32768 * i);
        const int corrected = correct(word + words);
        giveRoom();
        const auto isCorrected = [&] { return isShown(word); };
        EXPECT_EQ(corrected == 202 ? comesTrue(isCorrected) : isCorrected(), corrected < 300)
            << i << ' ' << corrected;
        fill(4096 * i);
        const int removed = remove(uidOf(i));
        giveRoom();
        const auto isGone = [&] { return !isShown(uidOf(i)); };
        EXPECT_EQ(removed == 202 ? comesTrue(isGone) : isGone(), removed < 300) << i << ' ' << removed;
        ++corrections[corrected];
        ++removals[removed];
    }
    EXPECT_TRUE(corrections.contains(200) && corrections.contains(503));
    EXPECT_TRUE(removals.contains(200) && removals.contains(202) && removals.contains(503));
    EXPECT_EQ(end(), 0);
}

}  // namespace
