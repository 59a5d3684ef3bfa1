#include "kddlib/archive/StudyChange.h"

#include "core/tagfile/ArchiveFixture.h"
#include "support/LogCapture.h"
#include "support/Process.h"

#include <QThread>

#include <future>

namespace Kdd
{
namespace
{

using Fault = ChangeFault;

/// Tag files of which a new database knows nothing.
class UnregisteredStudy : public ArchiveTest
{
protected:
    UnregisteredStudy()
    {
        save(largeImage("a", "1"), "a");
        save("b", "1");
        save(image("c", "1").inSeries("1.2"), "c");
        save(image("", "1").inSeries("1.2").without(DCM_SOPInstanceUID), "nameless");
        save("z", "2");
        TagFile::setCompressionMode(TagFile::CompressionMode::None);
        buildAll();
        Result result;
        mCatalogue = Kxg::Catalogue::open("sqlite:" + mStore.filePath("new.db").toUtf8(), result);
    }
    ~UnregisteredStudy() override { TagFile::setCompressionMode(TagFile::CompressionMode::Zlib); }

    Removal remove(const ArchiveNode& node) { return StudyChange(*mCatalogue).remove(node, 0); }

    const QString mTagFile = TagFile::cacheFilePathForStudy("1");
    const LogCapture mQuiet;
};

TEST_F(UnregisteredStudy, LosesWhatIsNamedAndNothingElse)
{
    const QByteArray nameless = path("nameless");
    const struct
    {
        ArchiveNode node;
        Uids gone;
        const char* absent = "";
    } steps[] = {
        {{"3", "1.1", "a"}, {}, "Study 3 has no image a"},
        {{"1", "1.2", "b"}, {}, "Study 1 has no image b"},
        {{"1", "", "b"}, {"b"}},
        {{"1", "1.2", nameless}, {nameless}},
        {{"1", "1.3", ""}, {}, "Study 1 has no series 1.3"},
        {{"1", "1.1", ""}, {"a"}},
        {{"1", "1.2", "c"}, {"c"}},
        {{"1", "", ""}, {}, "There is no study 1"},
        {{"2", "", ""}, {"z"}},
    };
    for (const auto& [node, gone, absent] : steps) {
        Uids left = imagesIn("1") + imagesIn("2");
        for (const QByteArray& key : gone)
            left.removeOne(key);
        const Removal removal = remove(node);
        EXPECT_EQ(removal.result.text().toStdString(), absent);
        EXPECT_EQ(removal.fault, *absent != 0 ? Fault::Absent : Fault::None);
        EXPECT_EQ(removal.images, gone.size());
        EXPECT_EQ(imagesIn("1") + imagesIn("2"), left);
    }
    EXPECT_EQ(tagFiles({"1", "2"}), Files());
}

TEST_F(UnregisteredStudy, IsTheOneThatAnotherRemovedMeanwhile)
{
    Result result;
    const auto known = Kxg::Catalogue::open(mAddress, result);
    std::unique_ptr<Kxg::StudyClaim> claim;
    ASSERT_TRUE(known->claim("2", 0, claim).good());
    auto second = std::async(std::launch::async, [&] {
        const auto own = Kxg::Catalogue::open(mAddress, result);
        return StudyChange(*own).remove({"2", "", ""}, 60'000);
    });
    QThread::msleep(300);  // of which it mostly waits for the first one
    ASSERT_TRUE(known->removeStudy("2").good() && claim->noteRequests().good());
    QFile::remove(TagFile::cacheFilePathForStudy("2"));
    ASSERT_TRUE(claim->finishRemoved().good());
    claim.reset();
    const Removal removal = second.get();
    EXPECT_EQ(removal.fault, Fault::Absent) << removal.result.text().toStdString();
}

TEST_F(UnregisteredStudy, StaysAsItIsWhenItCannotBeReadHeldOrWritten)
{
    const QByteArray bytes = fileContent(mTagFile);
    for (const QByteArray& other : {bytes.left(30), fileContent(TagFile::cacheFilePathForStudy("2"))}) {
        putFile(mTagFile, other);
        EXPECT_EQ(remove({"1", "", ""}).fault, Fault::Failed);
        EXPECT_EQ(fileContent(mTagFile), other);
    }
    putFile(mTagFile, bytes);
    {
        const StoppedProcess holder([] { return (new TagFile)->readCacheFileForStudy("1", true); });
        EXPECT_EQ(remove({"1", "", "b"}).fault, Fault::LockedOut);
    }
    {
        const FullDisk disk(2'000'000);
        EXPECT_EQ(remove({"1", "", "b"}).fault, Fault::Failed);
    }
    EXPECT_EQ(fileContent(mTagFile), bytes);
    EXPECT_EQ(remove({"1", "", "b"}).images, 1);
}

}  // namespace
}  // namespace Kdd
