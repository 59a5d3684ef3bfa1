#include "platform/os/ExclusiveFile.h"

#include <QFile>
#include <QTemporaryDir>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <functional>
#include <string>

using namespace Kdd;

namespace
{

constexpr LockPolling kOnce = {1, 0};
constexpr LockPolling kPatient = {30000, 1};
// A pause between two attempts would hold the test up for an hour.
constexpr LockPolling kNeverPausing = {1000, 3600000};

/// Another process that says one word to the test, and hears one.
class Other
{
public:
    explicit Other(const std::function<void(Other&)>& life)
    {
        EXPECT_EQ(::pipe2(mToTest, O_CLOEXEC), 0);
        EXPECT_EQ(::pipe2(mToOther, O_CLOEXEC), 0);
        mPid = ::fork();
        // Each side keeps its own ends only, so that it notices when the other is gone.
        closeEnds(mPid == 0 ? mToTest[0] : mToTest[1], mPid == 0 ? mToOther[1] : mToOther[0]);
        if (mPid != 0)
            return;
        life(*this);
        ::_exit(0);
    }
    ~Other()
    {
        kill();
        closeEnds(mToTest[0], mToOther[1]);
    }
    Other(const Other&) = delete;
    Other& operator=(const Other&) = delete;

    void sayReady() { EXPECT_EQ(::write(mToTest[1], "r", 1), 1); }
    void awaitReady()
    {
        char word = 0;
        ASSERT_EQ(::read(mToTest[0], &word, 1), 1);
    }
    void awaitEndOfTest()
    {
        char word = 0;
        static_cast<void>(!::read(mToOther[0], &word, 1));
    }
    void kill()
    {
        if (mPid > 0)
            ::kill(mPid, SIGKILL);
        join();
    }
    int join()
    {
        int status = -1;
        if (mPid > 0)
            ::waitpid(mPid, &status, 0);
        mPid = -1;
        return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    }

private:
    static void closeEnds(int one, int other)
    {
        ::close(one);
        ::close(other);
    }

    int mToTest[2] = {-1, -1};
    int mToOther[2] = {-1, -1};
    pid_t mPid = -1;
};

class ExclusiveFileTest : public testing::Test
{
protected:
    void SetUp() override { ASSERT_TRUE(mFolder.isValid()); }

    QString path() const { return mFolder.filePath(QStringLiteral("file")); }
    QByteArray name() const { return QFile::encodeName(path()); }

    LockedOpenResult open(QFile& file, FileLock lock, LockPolling polling = kOnce) const
    {
        return openLockedFile(file, path(), lock, IfAbsent::Fail, polling);
    }
    LockedOpenResult create(QFile& file, LockPolling polling = kOnce) const
    {
        return openLockedFile(file, path(), FileLock::Exclusive, IfAbsent::Create, polling);
    }
    void write(const QByteArray& content) const
    {
        QFile file;
        ASSERT_TRUE(create(file));
        ASSERT_EQ(file.write(content), content.size());
    }
    QByteArray content() const
    {
        QFile file(path());
        return file.open(QIODevice::ReadOnly) ? file.readAll() : QByteArray("(no file)");
    }
    /// Whether a program that knows nothing of us finds the file free.
    bool isFreeForOthers() const
    {
        const std::string command = "flock -n -x '" + name().toStdString() + "' true";
        return std::system(command.c_str()) == 0;
    }

private:
    QTemporaryDir mFolder;
};

TEST_F(ExclusiveFileTest, CreatesAnAbsentFileOnlyWhenAllowed)
{
    QFile file;
    const LockedOpenResult refused = open(file, FileLock::Exclusive, kNeverPausing);
    EXPECT_EQ(refused.failure, OpenFailure::NotFound);
    EXPECT_EQ(refused.systemError, ENOENT);
    EXPECT_FALSE(file.isOpen());
    EXPECT_FALSE(QFile::exists(path()));
    EXPECT_TRUE(create(file));
    EXPECT_TRUE(QFile::exists(path()));
}

TEST_F(ExclusiveFileTest, NeverTruncates)
{
    write("old content");
    QFile file;
    ASSERT_TRUE(create(file));
    EXPECT_EQ(file.readAll(), "old content");
    EXPECT_TRUE(file.seek(0));
    EXPECT_EQ(file.write("new"), 3);
    file.close();
    EXPECT_EQ(content(), "new content");
}

TEST_F(ExclusiveFileTest, SharedIsForReadingOnly)
{
    write("content");
    QFile file;
    ASSERT_TRUE(open(file, FileLock::Shared));
    EXPECT_EQ(file.readAll(), "content");
    EXPECT_FALSE(file.isWritable());
    EXPECT_EQ(::write(file.handle(), "x", 1), -1);
}

TEST_F(ExclusiveFileTest, OnlyReadersGoTogether)
{
    struct Pair
    {
        FileLock held, wanted;
        OpenFailure outcome;
    };
    const Pair pairs[] = {{FileLock::Shared, FileLock::Shared, OpenFailure::None},
                          {FileLock::Shared, FileLock::Exclusive, OpenFailure::Locked},
                          {FileLock::Exclusive, FileLock::Shared, OpenFailure::Locked},
                          {FileLock::Exclusive, FileLock::Exclusive, OpenFailure::Locked}};
    write("content");
    for (const Pair& pair : pairs) {
        Other holder([&](Other& self) {
            QFile file;
            if (open(file, pair.held))
                self.sayReady();
            self.awaitEndOfTest();
        });
        holder.awaitReady();
        QFile file;
        const LockPolling oneLongAttempt = {1, kNeverPausing.delayMs};
        EXPECT_EQ(open(file, pair.wanted, oneLongAttempt).failure, pair.outcome);
        QFile unlucky;
        EXPECT_EQ(open(unlucky, pair.wanted, {0, kNeverPausing.delayMs}).failure, pair.outcome);
    }
}

TEST_F(ExclusiveFileTest, ExcludesASecondOpeningInTheSameProcess)
{
    QFile first;
    QFile second;
    ASSERT_TRUE(create(first));
    EXPECT_EQ(open(second, FileLock::Shared, {3, 1}).failure, OpenFailure::Locked);
    EXPECT_FALSE(isFreeForOthers());
    first.close();
    EXPECT_TRUE(isFreeForOthers());
    EXPECT_TRUE(open(second, FileLock::Shared));
}

TEST_F(ExclusiveFileTest, TheDeathOfTheHolderFreesTheFile)
{
    Other holder([this](Other& self) {
        QFile file;
        if (create(file))
            self.sayReady();
        self.awaitEndOfTest();
    });
    holder.awaitReady();
    EXPECT_FALSE(isFreeForOthers());
    holder.kill();
    EXPECT_TRUE(isFreeForOthers());
}

TEST_F(ExclusiveFileTest, AProgramStartedMeanwhileDoesNotKeepTheLock)
{
    QFile file;
    ASSERT_TRUE(create(file));
    Other program([](Other& self) {
        self.sayReady();
        ::execlp("sleep", "sleep", "1000", nullptr);
    });
    program.awaitReady();
    file.close();
    QFile again;
    EXPECT_TRUE(open(again, FileLock::Exclusive, kPatient));  // patient: the start may take a moment
}

TEST_F(ExclusiveFileTest, PollsUntilTheHolderLetsGo)
{
    QFile file;
    ASSERT_TRUE(create(file));
    Other waiting([&](Other& self) {
        file.close();  // the inherited one, which shares our lock
        QFile own;
        if (open(own, FileLock::Exclusive).failure == OpenFailure::Locked)
            self.sayReady();
        ::_exit(open(own, FileLock::Exclusive, kPatient) ? 0 : 1);
    });
    waiting.awaitReady();
    file.close();
    EXPECT_EQ(waiting.join(), 0);
}

TEST_F(ExclusiveFileTest, WhoWaitsForADeletedFileGetsItsSuccessor)
{
    write("old");
    QFile file;
    ASSERT_TRUE(open(file, FileLock::Exclusive));
    Other waiting([&](Other& self) {
        file.close();  // the inherited one, which shares our lock
        QFile own;
        if (create(own).failure == OpenFailure::Locked)
            self.sayReady();
        ::_exit(create(own, kPatient) && own.write("new") == 3 && own.flush() ? 0 : 1);
    });
    waiting.awaitReady();
    EXPECT_TRUE(removeLocked(file, path()));
    EXPECT_FALSE(file.isOpen());
    EXPECT_EQ(waiting.join(), 0);
    EXPECT_EQ(content(), "new");
}

TEST_F(ExclusiveFileTest, RemovingReportsWhatTheSystemRefuses)
{
    QFile file;
    ASSERT_TRUE(create(file));
    EXPECT_FALSE(removeLocked(file, path() + QLatin1String("/below")));
    EXPECT_EQ(errno, ENOTDIR);
    EXPECT_FALSE(file.isOpen());
}

TEST_F(ExclusiveFileTest, WhatWaitingCannotCureIsReportedAtOnce)
{
    struct Fault
    {
        QString path;
        int error;
    };
    write("content");
    const Fault faults[] = {{path() + QLatin1String("/.."), ENOTDIR},
                            {path() + QString(300, QLatin1Char('x')), ENAMETOOLONG},
                            {path().chopped(5), EISDIR}};
    for (const Fault& fault : faults) {
        for (const FileLock lock : {FileLock::Shared, FileLock::Exclusive}) {
            const LockedOpenResult result = openLocked(fault.path, lock, IfAbsent::Fail, kNeverPausing);
            EXPECT_EQ(result.failure, OpenFailure::System);
            EXPECT_EQ(result.systemError, fault.error);
        }
    }
}

/// Adds one to the number in the file, or takes the number out into the ledger and deletes the file.
bool countOnce(const QString& path, const QString& ledger, bool deletes)
{
    QFile file;
    if (!openLockedFile(file, path, FileLock::Exclusive, IfAbsent::Create, {1000000, 0}))
        return false;
    const int count = file.readAll().toInt() + 1;
    if (!deletes)
        return file.seek(0) && file.write(QByteArray::number(count)) > 0 && file.flush();
    QFile out(ledger);
    return out.open(QIODevice::Append) && out.write(QByteArray::number(count) + '\n') > 0 && out.flush() &&
           removeLocked(file, path);
}

TEST_F(ExclusiveFileTest, NoCountIsLostWhileOthersDelete)
{
    constexpr int kRounds = 3000;
    const QString ledger = path() + QLatin1String(".ledger");
    const auto life = [&](Other&) {
        std::srand(static_cast<unsigned>(::getpid()));
        for (int round = 0; round < kRounds; ++round)
            if (!countOnce(path(), ledger, std::rand() % 3 == 0))
                ::_exit(1);
    };
    Other others[] = {Other(life), Other(life), Other(life), Other(life)};
    for (Other& other : others)
        ASSERT_EQ(other.join(), 0);

    ASSERT_TRUE(countOnce(path(), ledger, true));
    QFile in(ledger);
    ASSERT_TRUE(in.open(QIODevice::ReadOnly));
    int sum = 0;
    for (const QByteArray& line : in.readAll().split('\n'))
        sum += line.toInt();
    EXPECT_EQ(sum, 4 * kRounds + 1);
}

}  // namespace
