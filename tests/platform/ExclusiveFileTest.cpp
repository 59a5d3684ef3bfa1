#include "platform/os/ExclusiveFile.h"

#include "support/FileContent.h"
#include "support/Process.h"
#include "support/Threads.h"

#include <QFile>

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <random>

using namespace Kdd;

namespace
{

constexpr LockPolling kOnce = {1, 3600000};  // a pause after the attempt would hold the test up for an hour

class ExclusiveFileTest : public FileTest
{
protected:
    OpenFailure open(QFile& file, FileLock lock) const
    {
        const IfAbsent ifAbsent = lock == FileLock::Exclusive ? IfAbsent::Create : IfAbsent::Fail;
        return openLockedFile(file, path(), lock, ifAbsent, kOnce).failure;
    }

    /// Adds one to the number in the file, or takes the number out and deletes the file.
    bool countOnce(std::atomic<int>& taken, bool deletes) const
    {
        QFile file;
        if (!openLockedFile(file, path(), FileLock::Exclusive, IfAbsent::Create, {1000000, 0}))
            return false;
        const int count = file.readAll().toInt() + 1;
        if (!deletes)
            return file.seek(0) && file.write(QByteArray::number(count)) > 0 && file.flush();
        taken += count;
        return removeLocked(file, path()).good();
    }
};

TEST_F(ExclusiveFileTest, OnlyReadersGoTogetherAndDeathFreesTheFile)
{
    QFile file;
    ASSERT_EQ(open(file, FileLock::Exclusive), OpenFailure::None);
    for (const FileLock held : {FileLock::Shared, FileLock::Exclusive}) {
        file.close();
        {
            const StoppedProcess holder([&] { return open(file, held) == OpenFailure::None; });
            const bool isShared = held == FileLock::Shared;
            EXPECT_EQ(open(file, FileLock::Exclusive), OpenFailure::Locked);
            EXPECT_EQ(open(file, FileLock::Shared), isShared ? OpenFailure::None : OpenFailure::Locked);
            file.close();
        }
        EXPECT_EQ(open(file, FileLock::Exclusive), OpenFailure::None);
    }
    QFile second;  // of the same process
    EXPECT_EQ(open(second, FileLock::Shared), OpenFailure::Locked);
}

TEST_F(ExclusiveFileTest, APipeIsRefusedAndNotWaitedFor)
{
    ASSERT_EQ(::mkfifo(path().toLocal8Bit().constData(), 0600), 0);
    QFile file;
    for (const FileLock lock : {FileLock::Shared, FileLock::Exclusive})
        EXPECT_EQ(open(file, lock), OpenFailure::System);
}

TEST_F(ExclusiveFileTest, NoCountIsLostWhileOthersDelete)
{
    constexpr int kRounds = 3000;
    std::atomic<int> taken{0};
    onThreads(4, [&](int thread) {
        std::minstd_rand random(static_cast<unsigned>(thread) + 1);
        for (int round = 0; round < kRounds; ++round)
            ASSERT_TRUE(countOnce(taken, random() % 3 == 0));
    });
    ASSERT_TRUE(countOnce(taken, true));
    EXPECT_EQ(taken, 4 * kRounds + 1);
}

}  // namespace
