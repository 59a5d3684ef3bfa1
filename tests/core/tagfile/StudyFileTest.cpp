#include "kddlib/tagfile/StudyFile.h"

#include "core/tagfile/TagFileFixture.h"

using namespace Kdd;

namespace
{

class StudyFileTest : public TagFileTest
{
};

TEST_F(StudyFileTest, ACopyWrittenElsewhereLeavesTheFileHeldOpenTheStudysOwn)
{
    TagFile file;
    add(file, anImage("1"));
    ASSERT_TRUE(file.writeCacheFile() && file.readCacheFileForStudy("1.2", true));
    const QString elsewhere = mStore.filePath("elsewhere.tc");
    ASSERT_TRUE(file.writeCacheFile(elsewhere.toLocal8Bit().constData()));
    file.clear();
    EXPECT_TRUE(file.writeCacheFile()) << "of nothing, which removes the file held open";
    EXPECT_FALSE(QFile::exists(path()));
    EXPECT_TRUE(QFile::exists(elsewhere));
}

TEST_F(StudyFileTest, OneMadeInVainGoesUnlessAJournalIsItsContent)
{
    for (const bool isPromised : {false, true}) {
        StudyFile file;
        ASSERT_TRUE(file.open(path(), StudyFile::Access::HoldOrMake));
        if (isPromised)
            put(journal(), journalOf("content"));
        file.removeIfNeverWritten();
        EXPECT_EQ(QFile::exists(path()), isPromised);
    }
}

}  // namespace
