#include "kddlib/tagfile/TagFile.h"
#include "server/faults/Served.h"

using namespace Kdd;

namespace
{

/// What disks and backups do to files, and what the commands tell of it.
class Proof : public Served
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
    serve();
    QByteArray counted;
    EXPECT_TRUE(comesTrue([&] {
        counted = status("/metrics").body;
        return counted.contains("kdd_check_studies 2\n") && counted.contains("kdd_check_faulty_studies 1\n");
    })) << counted.toStdString();
    EXPECT_TRUE(counted.contains("kdd_check_healed 1\n")) << counted.toStdString();
    EXPECT_EQ(end(), 0);
    EXPECT_TRUE(fileContent(path("log")).contains("/images/1 is damaged"));
    EXPECT_EQ(kdd("verify --all").exitCode, 0);
}

TEST_F(Proof, AServerThatProvesServesNoWrongPreview)
{
    const Setting proves("KDD_SERVER_PROVES", "1");
    save("1", anImage("1").inStudy("1.2"));
    addImages();
    serve();
    const auto served = [this] { return get("studies/1.2/metadata").status; };
    EXPECT_EQ(served(), 200);
    // Stored without a checksum, as previews are: only the digest tells.
    EXPECT_EQ(kdd("--compression none build --all --again").exitCode, 0);
    EXPECT_EQ(served(), 200);
    const qint64 name = fileContent(tagFile("1.2")).indexOf("1.2.840.10008.");
    ASSERT_GT(name, 0);
    flipBit(tagFile("1.2"), name);
    EXPECT_EQ(served(), 500);
    EXPECT_EQ(kdd("verify --all --heal --json").number("healed"), 1);
    EXPECT_EQ(served(), 200);
    EXPECT_EQ(end(), 0);
    EXPECT_TRUE(fileContent(path("log")).contains("is damaged and not served"));
}

TEST_F(Proof, ObjectsThatArriveAreDigestedAsTheyPass)
{
    save("1", anImage("1").inStudy("1.2"));
    {
        const Setting digests("KDD_FILE_DIGESTS", "1");
        serve("--stow");
        EXPECT_EQ(ask("POST", "studies", "application/dicom", bytes("1")).status, 200);
        EXPECT_EQ(end(), 0);
    }
    const Answer deep = kdd("verify --all --deep --json");
    EXPECT_EQ(deep.exitCode, 0) << deep.err.toStdString();
    EXPECT_EQ(deep.number("files"), 1);
    EXPECT_EQ(deep.number("undigested"), 0);
}

}  // namespace
