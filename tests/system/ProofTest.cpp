#include "ServedStore.h"
#include "kddlib/tagfile/TagFile.h"
#include "support/Setting.h"

#include <QThread>

using namespace Kdd;

namespace
{

/// What disks and backups do to files, and what the commands tell of it.
class Proof : public ServedStore
{
protected:
    QString tagFile(const char* study) const
    {
        TagFile::setMetaFolder(path("store/meta").toUtf8().constData());
        return TagFile::cacheFilePathForStudy(study);
    }
};

TEST_F(Proof, VerifyTellsWhatATagFileIsAndHealsIt)
{
    addTwoStudies();
    const QByteArray first = fileContent(tagFile("1.2"));
    save("5", anImage("5").inSeries("1.2.4"));
    addImages();
    putFile(tagFile("1.2"), first);
    flipBit(tagFile("1.3"), 40);
    const Answer told = kdd("verify --all");
    EXPECT_EQ(told.exitCode, 1);
    EXPECT_TRUE(told.err.contains("it is an earlier one of this archive; \"kdd build --all\""))
        << told.err.data();
    const Answer healed = kdd("verify --all --heal --json");
    EXPECT_EQ(healed.exitCode, 1) << "there was something to heal";
    EXPECT_EQ(healed.number("healed"), 2) << healed.err.toStdString();
    EXPECT_EQ(healed.number("differences") + healed.number("unreadable"), 0) << healed.err.toStdString();
    EXPECT_EQ(kdd("verify --all --heal").exitCode, 0);
    EXPECT_EQ(imagesOf("1.2"), 4);
}

TEST_F(Proof, DeepVerifyTellsBitRotOfDicomFiles)
{
    addTwoStudies();
    EXPECT_EQ(kdd("verify --all --record").exitCode, 2);
    EXPECT_EQ(kdd("verify --all --deep --json").number("undigested"), 4);
    EXPECT_EQ(kdd("verify --all --deep --record --json").number("recorded"), 4);
    // In a value that tag files leave out, so that nothing else would tell.
    flipBit(file("1"), bytes("1").size() - 2);
    EXPECT_EQ(kdd("verify --all").exitCode, 0);
    const Answer deep = kdd("verify --all --deep --json");
    EXPECT_EQ(deep.exitCode, 1);
    EXPECT_EQ(deep.number("files"), 4);
    EXPECT_EQ(deep.number("faulty"), 1);
    EXPECT_TRUE(deep.err.contains("/images/1 is damaged: its bytes have changed")) << deep.err.data();
}

TEST_F(Proof, AServerLooksInTheBackground)
{
    const Setting digests("KDD_FILE_DIGESTS", "1");
    addTwoStudies();
    EXPECT_EQ(kdd("verify --all --deep --json").number("undigested"), 0);
    flipBit(file("1"), bytes("1").size() - 2);
    flipBit(tagFile("1.3"), 40);
    const Setting rate("KDD_CHECK_RATE", "100");
    const Setting heals("KDD_CHECK_HEALS", "1");
    const auto server = start("--json serve --listen 127.0.0.1:0 --status 127.0.0.1:0");
    const QByteArray status = jsonAt(toldBy(*server), "status").toString().toLatin1();
    QByteArray counted;
    const auto isDone = [&] {
        return counted.contains("kdd_check_studies 2\n") && counted.contains("kdd_check_faulty_studies 1\n");
    };
    for (int look = 0; look < 3000 && !isDone(); ++look) {
        counted = Client(status).ask("/metrics").body;
        QThread::msleep(10);
    }
    EXPECT_TRUE(counted.contains("kdd_check_faulty_studies 1\n")) << counted.toStdString();
    EXPECT_TRUE(counted.contains("kdd_check_healed 1\n")) << counted.toStdString();
    server->terminate();
    const Answer answer = finish(*server);
    EXPECT_EQ(answer.exitCode, 0);
    EXPECT_TRUE(answer.err.contains("/images/1 is damaged")) << answer.err.toStdString();
    EXPECT_EQ(kdd("verify --all").exitCode, 0);
}

TEST_F(Proof, AServerThatProvesServesNoWrongPreview)
{
    const Setting proves("KDD_SERVER_PROVES", "1");
    save("1", anImage("1").inStudy("1.2"));
    addImages();
    Addresses addresses;
    const auto server = serve(addresses);
    const auto status = [&] { return Client(addresses.http).ask("/dicom-web/studies/1.2/metadata").status; };
    EXPECT_EQ(status(), 200);
    // Stored without a checksum, as previews are: only the digest tells.
    EXPECT_EQ(kdd("--compression none build --all --again").exitCode, 0);
    EXPECT_EQ(status(), 200);
    const qint64 name = fileContent(tagFile("1.2")).indexOf("1.2.840.10008.");
    ASSERT_GT(name, 0);
    flipBit(tagFile("1.2"), name);
    EXPECT_EQ(status(), 500);
    EXPECT_EQ(kdd("verify --all --heal --json").number("healed"), 1);
    EXPECT_EQ(status(), 200);
    server->terminate();
    EXPECT_TRUE(finish(*server).err.contains("is damaged and not served"));
}

TEST_F(Proof, ObjectsThatArriveAreDigestedAsTheyPass)
{
    save("1", anImage("1").inStudy("1.2"));
    {
        const Setting digests("KDD_FILE_DIGESTS", "1");
        Addresses addresses;
        const auto server = serve(addresses);
        EXPECT_EQ(send(addresses, bytes("1")), 200);
        server->terminate();
        EXPECT_EQ(finish(*server).exitCode, 0);
    }
    const Answer deep = kdd("verify --all --deep --json");
    EXPECT_EQ(deep.exitCode, 0) << deep.err.toStdString();
    EXPECT_EQ(deep.number("files"), 1);
    EXPECT_EQ(deep.number("undigested"), 0);
}

}  // namespace
