#include "platform/filecache/ExFileCache.h"

#include <QDir>
#include <QTemporaryDir>

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

using namespace Kdd;

namespace
{

class FileCache : public testing::Test
{
protected:
    void SetUp() override { ASSERT_TRUE(mCache.init(mPath.constData()).good()); }

    QByteArray read(const char* name) const
    {
        QByteArray bytes = "nothing";
        mCache.readBuffer(name, bytes);
        return bytes;
    }

    QTemporaryDir mFolder;
    QByteArray mPath = QFile::encodeName(mFolder.filePath(QStringLiteral("cache/of/files")));
    ExFileCache mCache;
};

TEST_F(FileCache, KeepsEntriesByAnyNameInsideItsFolder)
{
    for (const char* name : {"1.2.3 Level1", "../../outside", "/etc/kdd", "a\nb", ""}) {
        ASSERT_TRUE(mCache.storeBuffer(name, "old").good());
        ASSERT_TRUE(mCache.storeBuffer(name, QByteArray("n\0w", 3)).good());
        EXPECT_EQ(read(name), QByteArray("n\0w", 3)) << name;
    }
    EXPECT_TRUE(mCache.removeBuffer("") && mCache.removeBuffer(""));
    EXPECT_EQ(read(""), "nothing");
    EXPECT_EQ(QDir(QFile::decodeName(mPath)).entryList(QDir::Files | QDir::Hidden).size(), 4);
}

TEST_F(FileCache, WithoutAFolderIsAFailure)
{
    ExFileCache cache;
    EXPECT_TRUE(cache.init("/proc/self/status/cache").bad());
    EXPECT_TRUE(cache.storeBuffer("a", "1").bad());
}

/// One process writes two contents in turn; the other never reads anything else.
TEST_F(FileCache, NeverShowsHalfAnEntryToAnotherProcess)
{
    const QByteArray first(300000, '1');
    const QByteArray second(200000, '2');
    ASSERT_TRUE(mCache.storeBuffer("a", first).good());
    const pid_t writer = ::fork();
    if (writer == 0) {
        for (int i = 0; i < 60; ++i)
            mCache.storeBuffer("a", i % 2 == 0 ? second : first);
        ::_exit(0);
    }
    for (int i = 0; i < 500; ++i) {
        const QByteArray bytes = read("a");
        ASSERT_TRUE(bytes == first || bytes == second) << bytes.size();
    }
    EXPECT_EQ(::waitpid(writer, nullptr, 0), writer);
}

}  // namespace
