#include "platform/os/JournaledWrite.h"

#include "platform/os/ExclusiveFile.h"

#include <QFile>
#include <QTemporaryDir>
#include <QtEndian>

#include <gtest/gtest.h>
#include <libdeflate.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <string>

using namespace Kdd;

namespace
{

const QByteArray kOld = QByteArray("the old content, longer than the new").repeated(3);
const QByteArray kNew("what replaces it");

QByteArray journalWith(quint64 length, const QByteArray& content)
{
    QByteArray bytes("KDDJRNL1............");
    qToLittleEndian(length, bytes.data() + 8);
    const auto size = static_cast<size_t>(content.size());
    qToLittleEndian(libdeflate_crc32(0, content.constData(), size), bytes.data() + 16);
    return bytes + content;
}

QByteArray journalOf(const QByteArray& content)
{
    return journalWith(static_cast<quint64>(content.size()), content);
}

class JournaledWriteTest : public testing::Test
{
protected:
    void SetUp() override
    {
        ASSERT_TRUE(mFolder.isValid());
        put(path(), kOld);
    }

    QString path() const { return mFolder.filePath(QStringLiteral("file")); }

    static void put(const QString& where, const QByteArray& bytes)
    {
        QFile file(where);
        ASSERT_TRUE(file.open(QIODevice::WriteOnly));
        ASSERT_EQ(file.write(bytes), bytes.size());
    }
    QByteArray content() const
    {
        QFile file(path());
        return file.open(QIODevice::ReadOnly) ? file.readAll() : QByteArray("(no file)");
    }
    void lock(QFile& file) const
    {
        ASSERT_TRUE(openLockedFile(file, path(), FileLock::Exclusive, IfAbsent::Create, {1, 0}));
    }
    QString write(const QByteArray& bytes, WriteOptions options = {}) const
    {
        QFile file;
        lock(file);
        return writeInPlace(file, path(), bytes, options);
    }
    QString recover() const
    {
        QFile file;
        lock(file);
        return recoverInterruptedWrite(file, path(), Flush::Process);
    }
    /// The status of a process that prepares itself as asked and then writes: 0 or 1 when it reported success
    /// or failure, else the signal that killed it.
    int writeInProcess(const QByteArray& bytes, const std::function<void(int target)>& prepare) const
    {
        const pid_t pid = ::fork();
        if (pid == 0) {
            const rlimit noCore = {0, 0};
            ::setrlimit(RLIMIT_CORE, &noCore);
            QFile file;
            lock(file);
            prepare(file.handle());
            ::_exit(writeInPlace(file, path(), bytes, {Flush::Disk, Tail::Cut}).isEmpty() ? 0 : 1);
        }
        int status = -1;
        ::waitpid(pid, &status, 0);
        return WIFEXITED(status) ? WEXITSTATUS(status) : WTERMSIG(status);
    }

private:
    QTemporaryDir mFolder;
};

TEST_F(JournaledWriteTest, TheTailIsKeptOrCut)
{
    EXPECT_EQ(write(kNew), QString());
    EXPECT_EQ(content(), kNew + kOld.mid(kNew.size()));
    EXPECT_EQ(write(kNew, {Flush::Process, Tail::Cut}), QString());
    EXPECT_EQ(content(), kNew);
    EXPECT_EQ(write(kOld, {Flush::Disk}), QString());
    EXPECT_EQ(content(), kOld);
    EXPECT_EQ(write({}, {Flush::Disk, Tail::Cut}), QString());
    EXPECT_EQ(content(), QByteArray());
    EXPECT_FALSE(hasJournal(path()));
}

TEST_F(JournaledWriteTest, TheFileStaysUsableAndLocked)
{
    QFile file;
    lock(file);
    EXPECT_EQ(file.peek(10), kOld.left(10));  // reads ahead
    EXPECT_EQ(writeInPlace(file, path(), kNew), QString());
    EXPECT_EQ(file.read(kNew.size()), kNew);
    EXPECT_TRUE(file.seek(0));
    EXPECT_EQ(file.write("W"), 1);  // held back
    EXPECT_EQ(writeInPlace(file, path(), "H", {Flush::Process, Tail::Cut}), QString());
    EXPECT_EQ(file.write("h"), 1);
    EXPECT_EQ(writeInPlace(file, path(), {}), QString());
    const std::string command = "flock -n '" + QFile::encodeName(path()).toStdString() + "' true";
    EXPECT_NE(std::system(command.c_str()), 0);
    file.close();
    EXPECT_EQ(content(), "h");
}

TEST_F(JournaledWriteTest, AClosedFileIsRefused)
{
    QFile file;
    const QString reason = writeInPlace(file, path(), kNew);
    EXPECT_TRUE(reason.contains(path()) && reason.endsWith(QString::fromLocal8Bit(std::strerror(EBADF))));
    EXPECT_EQ(content(), kOld);
    EXPECT_FALSE(hasJournal(path()));
}

TEST_F(JournaledWriteTest, ALinkInPlaceOfTheJournalIsNotFollowed)
{
    const QString victim = path() + QLatin1String(".victim");
    put(victim, "precious");
    ASSERT_TRUE(QFile::link(victim, journalPath(path())));
    EXPECT_TRUE(write(kNew).contains(journalPath(path())));
    QFile file(victim);
    ASSERT_TRUE(file.open(QIODevice::ReadOnly));
    EXPECT_EQ(file.readAll(), "precious");
    EXPECT_EQ(content(), kOld);
}

TEST_F(JournaledWriteTest, WhereverTheFileWasTornRecoveryCompletesIt)
{
    for (int torn = 0; torn <= kNew.size(); ++torn) {
        put(path(), kNew.left(torn) + kOld.mid(torn));
        put(journalPath(path()), journalOf(kNew));
        EXPECT_TRUE(hasJournal(path()));
        EXPECT_EQ(recover(), QString());
        EXPECT_EQ(content(), kNew + kOld.mid(kNew.size()));
        EXPECT_FALSE(hasJournal(path()));
    }
}

TEST_F(JournaledWriteTest, ADamagedJournalIsDroppedAndTheFileLeftAlone)
{
    const QByteArray whole = journalOf(kNew);
    QVector<QByteArray> damaged = {whole + 'x', journalWith(~quint64{0}, kNew), journalWith(0, kNew),
                                   journalWith(quint64{1} << 32, kNew)};
    for (int i = 0; i < whole.size(); ++i) {
        damaged.append(whole.left(i));
        damaged.append(whole);
        damaged.last()[i] = static_cast<char>(whole.at(i) ^ 1);
    }
    for (const QByteArray& journal : qAsConst(damaged)) {
        put(journalPath(path()), journal);
        EXPECT_EQ(recover(), QString());
        EXPECT_EQ(content(), kOld) << journal.toHex().constData();
        EXPECT_FALSE(hasJournal(path()));
    }
}

TEST_F(JournaledWriteTest, TheNextWriterFirstFinishesWhatItFinds)
{
    put(path(), kNew.left(3) + kOld.mid(3));
    put(journalPath(path()), journalOf(kNew));
    EXPECT_EQ(write("T"), QString());
    EXPECT_EQ(content(), 'T' + kNew.mid(1) + kOld.mid(kNew.size()));
}

TEST_F(JournaledWriteTest, ARecoveryThatFailsKeepsTheJournal)
{
    put(journalPath(path()), journalOf(kNew));
    QFile reader;
    ASSERT_TRUE(openLockedFile(reader, path(), FileLock::Shared, IfAbsent::Fail, {1, 0}));
    EXPECT_TRUE(recoverInterruptedWrite(reader, path(), Flush::Process).contains(path()));
    EXPECT_TRUE(hasJournal(path()));
}

TEST_F(JournaledWriteTest, DeletingTakesTheJournalAlong)
{
    put(journalPath(path()), journalOf(kNew));
    QFile file;
    lock(file);
    EXPECT_EQ(removeWithJournal(file, path()), QString());
    EXPECT_FALSE(file.isOpen());
    EXPECT_FALSE(QFile::exists(path()));
    EXPECT_FALSE(hasJournal(path()));
}

// From here on the system refuses a step of the write, or the process dies in it.

void limitFileSize(rlim_t size)
{
    const rlimit limit = {size, size};
    ::setrlimit(RLIMIT_FSIZE, &limit);
}

TEST_F(JournaledWriteTest, AJournalThatFindsNoRoomLeavesEverythingAsItWas)
{
    const auto prepare = [](int) {
        ::signal(SIGXFSZ, SIG_IGN);
        limitFileSize(1000);
    };
    EXPECT_EQ(writeInProcess(QByteArray(990, 'n'), prepare), 1);
    EXPECT_EQ(content(), kOld);
    EXPECT_FALSE(hasJournal(path()));
}

TEST_F(JournaledWriteTest, DeathHalfwayThroughTheJournalLosesOnlyTheNewContent)
{
    EXPECT_EQ(writeInProcess(QByteArray(990, 'n'), [](int) { limitFileSize(1000); }), SIGXFSZ);
    EXPECT_TRUE(hasJournal(path()));
    EXPECT_EQ(recover(), QString());
    EXPECT_EQ(content(), kOld);
}

enum class On { Target, Others };

/// A system call, on the file itself or on anything else, that is answered with an error or with death (0).
struct Step
{
    const char* name;
    unsigned call;
    On on;
    unsigned error;
    const QByteArray* expected;  // after recovery
};

void breakStep(const Step& step, int target)
{
    const unsigned verdict = step.error == 0 ? SECCOMP_RET_KILL_PROCESS : SECCOMP_RET_ERRNO | step.error;
    const unsigned onTarget = step.on == On::Target ? verdict : SECCOMP_RET_ALLOW;
    const unsigned onOthers = step.on == On::Target ? SECCOMP_RET_ALLOW : verdict;
    sock_filter filter[] = {
        {BPF_LD | BPF_W | BPF_ABS, 0, 0, offsetof(seccomp_data, nr)},
        {BPF_JMP | BPF_JEQ | BPF_K, 0, 3, step.call},
        {BPF_LD | BPF_W | BPF_ABS, 0, 0, offsetof(seccomp_data, args)},
        {BPF_JMP | BPF_JEQ | BPF_K, 0, 2, static_cast<unsigned>(target)},
        {BPF_RET | BPF_K, 0, 0, onTarget},
        {BPF_RET | BPF_K, 0, 0, SECCOMP_RET_ALLOW},
        {BPF_RET | BPF_K, 0, 0, onOthers},
    };
    const sock_fprog program = {sizeof filter / sizeof *filter, filter};
    if (::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0 ||
        ::prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program) != 0)
        ::_exit(100);
}

const QByteArray kLonger = kOld + kNew;

const Step kSteps[] = {
    {"WritingTheJournalFails", SYS_pwrite64, On::Others, ENOSPC, &kOld},
    {"WritingTheJournalKills", SYS_pwrite64, On::Others, 0, &kOld},
    {"FlushingTheJournalFails", SYS_fsync, On::Others, EIO, &kOld},
    {"FlushingTheJournalKills", SYS_fsync, On::Others, 0, &kLonger},
    {"ReservingFails", SYS_fallocate, On::Target, ENOSPC, &kOld},
    {"ReservingKills", SYS_fallocate, On::Target, 0, &kLonger},
    {"WritingInPlaceFails", SYS_pwrite64, On::Target, EIO, &kLonger},
    {"WritingInPlaceKills", SYS_pwrite64, On::Target, 0, &kLonger},
    {"CuttingFails", SYS_ftruncate, On::Target, EIO, &kLonger},
    {"CuttingKills", SYS_ftruncate, On::Target, 0, &kLonger},
    {"FlushingTheFileFails", SYS_fsync, On::Target, EIO, &kLonger},
    {"FlushingTheFileKills", SYS_fsync, On::Target, 0, &kLonger},
    {"RemovingTheJournalFails", SYS_unlink, On::Others, EROFS, &kLonger},
    {"RemovingTheJournalKills", SYS_unlink, On::Others, 0, &kLonger},
};

class BrokenWrite : public JournaledWriteTest, public testing::WithParamInterface<Step>
{
};

TEST_P(BrokenWrite, IsReportedAndLeavesTheOldContentOrTheNew)
{
    const Step& step = GetParam();
    EXPECT_EQ(writeInProcess(kLonger, [&step](int target) { breakStep(step, target); }),
              step.error == 0 ? SIGSYS : 1);
    // What was undone needs no recovery, and everything else is marked as unfinished.
    EXPECT_TRUE(hasJournal(path()) || content() == kOld);
    EXPECT_EQ(recover(), QString());
    EXPECT_EQ(content(), *step.expected);
    EXPECT_FALSE(hasJournal(path()));
}

INSTANTIATE_TEST_SUITE_P(Steps, BrokenWrite, testing::ValuesIn(kSteps),
                         [](const auto& row) { return std::string(row.param.name); });

TEST_F(JournaledWriteTest, AFileSystemThatCannotReserveIsWrittenAllTheSame)
{
    for (const unsigned answer : {unsigned{EOPNOTSUPP}, unsigned{EINVAL}}) {
        put(path(), kOld);
        const Step noReserving = {"", SYS_fallocate, On::Target, answer, nullptr};
        EXPECT_EQ(writeInProcess(kLonger, [&](int target) { breakStep(noReserving, target); }), 0);
        EXPECT_EQ(content(), kLonger);
    }
}

TEST_F(JournaledWriteTest, WhoMayUseTheFileMayRecoverIt)
{
    ASSERT_EQ(::chmod(QFile::encodeName(path()).constData(), 0660), 0);
    const Step dying = {"", SYS_pwrite64, On::Target, 0, nullptr};
    writeInProcess(kNew, [&](int target) {
        ::umask(0077);
        breakStep(dying, target);
    });
    struct stat journal = {};
    ASSERT_EQ(::stat(QFile::encodeName(journalPath(path())).constData(), &journal), 0);
    EXPECT_EQ(journal.st_mode & 0777, 0660U);
}

}  // namespace
