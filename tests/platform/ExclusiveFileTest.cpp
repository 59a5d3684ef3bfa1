#include "platform/os/ExclusiveFile.h"

#include "support/FileContent.h"

#include <QFile>

#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <csignal>
#include <cstdlib>
#include <functional>
#include <new>
#include <utility>

using namespace Kdd;

namespace
{

constexpr LockPolling kOnce = {1, 3600000};  // a pause after the attempt would hold the test up for an hour

/// Another process, which dies with the test.
class Other
{
public:
    explicit Other(const std::function<bool()>& life)
        : mPid(::fork())
    {
        if (mPid != 0)
            return;
        ::prctl(PR_SET_PDEATHSIG, SIGKILL);
        ::_exit(life() ? 0 : 1);
    }
    ~Other()
    {
        if (mPid > 0 && ::kill(mPid, SIGKILL) == 0)
            ::waitpid(mPid, nullptr, 0);
    }
    Other(const Other&) = delete;
    Other& operator=(const Other&) = delete;

    bool stops() const
    {
        int status = 0;
        return ::waitpid(mPid, &status, WUNTRACED) == mPid && WIFSTOPPED(status);
    }
    bool succeeds()
    {
        int status = -1;
        const pid_t pid = std::exchange(mPid, -1);
        return ::waitpid(pid, &status, 0) == pid && status == 0;
    }

private:
    pid_t mPid;
};

class ExclusiveFileTest : public FileTest
{
protected:
    OpenFailure open(QFile& file, FileLock lock) const
    {
        const IfAbsent ifAbsent = lock == FileLock::Exclusive ? IfAbsent::Create : IfAbsent::Fail;
        return openLockedFile(file, path(), lock, ifAbsent, kOnce).failure;
    }
};

TEST_F(ExclusiveFileTest, OnlyReadersGoTogetherAndDeathFreesTheFile)
{
    QFile file;
    ASSERT_EQ(open(file, FileLock::Exclusive), OpenFailure::None);
    for (const FileLock held : {FileLock::Shared, FileLock::Exclusive}) {
        file.close();
        {
            Other holder([&] { return open(file, held) == OpenFailure::None && ::raise(SIGSTOP) == 0; });
            ASSERT_TRUE(holder.stops());
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

/// Adds one to the number in the file, or takes the number out and deletes the file.
bool countOnce(const QString& path, std::atomic<int>& taken, bool deletes)
{
    QFile file;
    if (!openLockedFile(file, path, FileLock::Exclusive, IfAbsent::Create, {1000000, 0}))
        return false;
    const int count = file.readAll().toInt() + 1;
    if (!deletes)
        return file.seek(0) && file.write(QByteArray::number(count)) > 0 && file.flush();
    taken += count;
    return removeLocked(file, path).good();
}

TEST_F(ExclusiveFileTest, NoCountIsLostWhileOthersDelete)
{
    constexpr int kRounds = 3000;
    void* shared = ::mmap(nullptr, sizeof(int), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    ASSERT_NE(shared, MAP_FAILED);
    auto& taken = *new (shared) std::atomic<int>(0);
    const auto life = [&] {
        std::srand(static_cast<unsigned>(::getpid()));
        int round = 0;
        while (round < kRounds && countOnce(path(), taken, std::rand() % 3 == 0))
            ++round;
        return round == kRounds;
    };
    Other others[] = {Other(life), Other(life), Other(life), Other(life)};
    for (Other& other : others)
        ASSERT_TRUE(other.succeeds());
    ASSERT_TRUE(countOnce(path(), taken, true));
    EXPECT_EQ(taken, 4 * kRounds + 1);
}

}  // namespace
