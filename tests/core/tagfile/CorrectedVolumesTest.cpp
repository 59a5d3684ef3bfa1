#include "ArchiveFixture.h"
#include "kddlib/volumes/Volume.h"
#include "support/LogCapture.h"

namespace Kdd
{
namespace
{

/// A study whose images a volume file holds.
class CorrectedVolumes : public ArchiveTest
{
protected:
    CorrectedVolumes()
    {
        for (const char* uid : {"a", "b", "c"})
            save(uid, "1");
        save("z", "2");
        writeVolume("1.1-stack.vol", {"a", "b", "c"}, {{"G0020-000E", "UI:1.1"}});
        registerFiles({{}, {{path("1.1-stack.vol"), {}, "1", "1.1"}}, {}});
        buildAll();
    }

    /// "1.1: a b c (stack)" for every volume; one that is divided has no geometry.
    static std::string volumes()
    {
        std::string all;
        for (const char* study : {"1", "2"}) {
            TagFile file;
            file.readCacheFileForStudy(study, false);
            for (auto it = file.seriesByUID().cbegin(); it != file.seriesByUID().cend(); ++it) {
                for (const Volume* volume : it.value()->volumes()) {
                    all += it.key().toStdString() + ":";
                    for (const std::string& slice : volume->sopUIDList())
                        all += ' ' + slice;
                    all += volume->isBareVolume() ? " bare" : " whole";
                    EXPECT_EQ(volume->isBareVolume(), volume->previewData().isEmpty());
                    all += " (" + volume->fileNameSuffix().toStdString() + ")\n";
                }
            }
        }
        return all;
    }

    void expectVolumes(const std::string& expected)
    {
        EXPECT_EQ(volumes(), expected) << "after the correction";
        const LogCapture log;
        buildAll();
        EXPECT_EQ(volumes(), expected) << "after a build";
        EXPECT_EQ(log.count("unknown image"), 0);
    }
};

TEST_F(CorrectedVolumes, WhoseImagesAllMoveGoAlong)
{
    correct(edit({"a"}, {{DCM_SOPInstanceUID, QStringLiteral("a2")}}));
    expectVolumes("1.1: a2 b c whole (stack)\n");
    correct(edit({"a2", "b", "c"}, {{DCM_SeriesInstanceUID, QStringLiteral("1.7")}}));
    expectVolumes("1.7: a2 b c whole (stack)\n");
    correct(move({"a2", "b", "c"}, "1", "2"));
    expectVolumes("2.5: a2 b c whole (stack)\n");
}

TEST_F(CorrectedVolumes, ThatAreDividedHaveOnlyImagesAndSlices)
{
    correct(move({"b"}, "1", "2", {{DCM_SOPInstanceUID, QStringLiteral("b2")}}));
    expectVolumes("1.1: a c bare ()\n2.5: b2 bare ()\n");
    correct(edit({"a"}, {{DCM_SeriesInstanceUID, QStringLiteral("1.7")}}));
    expectVolumes("1.1: c bare ()\n1.7: a bare ()\n2.5: b2 bare ()\n");
}

TEST_F(CorrectedVolumes, WhoseFileCannotBeReadStayAndThoseLeftAloneMakeNoTagFile)
{
    ASSERT_TRUE(QFile::remove(QString::fromLocal8Bit(path("1.1-stack.vol"))));
    expectVolumes("1.1: a b c whole (stack)\n");
    correct(move({"b"}, "1", "2"));
    expectVolumes("1.1: a c bare ()\n2.5: b bare ()\n");
    correct(move({"a", "c"}, "1", "2"));
    build("1");
    EXPECT_FALSE(QFile::exists(TagFile::cacheFilePathForStudy("1")));
    EXPECT_EQ(waiting(), 0);
}

}  // namespace
}  // namespace Kdd
