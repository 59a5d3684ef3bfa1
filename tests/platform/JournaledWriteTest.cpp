#include "platform/os/JournaledWrite.h"

#include "platform/os/ExclusiveFile.h"
#include "support/FileContent.h"
#include "support/Process.h"

#include <QFile>

#include <gtest/gtest.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <sys/syscall.h>

#include <cerrno>
#include <cstddef>

using namespace Kdd;

namespace
{

const QByteArray kOld = QByteArray("the old content, longer than the new").repeated(3);
const QByteArray kNew("what replaces it");
const QByteArray kLonger = kOld + kNew;

const QByteArray kJournal = journalOf(kNew);

enum class On { Target, Others };

/// A system call, on the file itself or on anything else, that is answered with an error or with death.
struct Step
{
    const char* name;
    unsigned call;
    On on;
    unsigned error;
    QByteArray afterError, afterDeath;  // and recovery
};

void breakStep(const Step& step, unsigned verdict, int target)
{
    const bool isOther = step.on == On::Others;
    sock_filter filter[] = {
        {BPF_LD | BPF_W | BPF_ABS, 0, 0, offsetof(seccomp_data, nr)},
        {BPF_JMP | BPF_JEQ | BPF_K, 0, 3, step.call},
        {BPF_LD | BPF_W | BPF_ABS, 0, 0, offsetof(seccomp_data, args)},
        {BPF_JMP | BPF_JEQ | BPF_K, isOther, !isOther, static_cast<unsigned>(target)},
        {BPF_RET | BPF_K, 0, 0, verdict},
        {BPF_RET | BPF_K, 0, 0, SECCOMP_RET_ALLOW},
    };
    const sock_fprog program = {sizeof filter / sizeof *filter, filter};
    if (::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0 ||
        ::prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program) != 0)
        ::_exit(100);
}

class JournaledWriteTest : public FileTest
{
protected:
    JournaledWriteTest() { putFile(path(), kOld); }

    void lock(QFile& file) const
    {
        ASSERT_TRUE(openLockedFile(file, path(), FileLock::Exclusive, IfAbsent::Create, {1, 0}));
    }
    bool write(const QByteArray& bytes, WriteOptions options = {}) const
    {
        QFile file;
        lock(file);
        return writeInPlace(file, path(), bytes, options).good();
    }
    void expectRecovered(const QByteArray& expected) const
    {
        QFile file;
        lock(file);
        EXPECT_TRUE(recoverInterruptedWrite(file, path(), Flush::Process).good());
        EXPECT_EQ(content(), expected);
        EXPECT_FALSE(hasJournal(path()));
    }
    /// In another process: whether it reported success, or the signal that killed it.
    int writeBroken(const QByteArray& bytes, const Step& step, unsigned verdict) const
    {
        return inChild([&] {
            ::prctl(PR_SET_DUMPABLE, 0);
            QFile file;
            lock(file);
            breakStep(step, verdict, file.handle());
            return writeInPlace(file, path(), bytes, {Flush::Disk, Tail::Cut}).good();
        });
    }
};

TEST_F(JournaledWriteTest, RecoveryOrTheNextWriterCompletesATornFile)
{
    for (int torn = 0; torn <= kNew.size(); ++torn) {
        putFile(path(), kNew.left(torn) + kOld.mid(torn));
        putFile(journalPath(path()), kJournal);
        expectRecovered(kNew + kOld.mid(kNew.size()));
    }
    putFile(path(), kOld);
    putFile(journalPath(path()), kJournal);
    EXPECT_TRUE(write("T"));
    EXPECT_EQ(content(), 'T' + kNew.mid(1) + kOld.mid(kNew.size()));
    EXPECT_TRUE(write(kNew, {Flush::Process, Tail::Cut}));
    EXPECT_EQ(content(), kNew);
    EXPECT_FALSE(hasJournal(path()));
}

TEST_F(JournaledWriteTest, ADamagedJournalIsDroppedAndTheFileLeftAlone)
{
    QVector<QByteArray> damaged = {kJournal + 'x'};
    for (int i = 0; i < kJournal.size(); ++i) {
        damaged << kJournal.left(i) << kJournal;
        damaged.last()[i] = static_cast<char>(kJournal.at(i) ^ 1);
    }
    for (const QByteArray& journal : qAsConst(damaged)) {
        SCOPED_TRACE(journal.toHex().constData());
        putFile(journalPath(path()), journal);
        expectRecovered(kOld);
    }
}

const Step kSteps[] = {
    {"writing the journal", SYS_pwrite64, On::Others, ENOSPC, kOld, kOld},
    {"flushing the journal", SYS_fsync, On::Others, EIO, kOld, kLonger},
    {"reserving", SYS_fallocate, On::Target, ENOSPC, kOld, kLonger},
    {"writing in place", SYS_pwrite64, On::Target, EIO, kLonger, kLonger},
    {"cutting", SYS_ftruncate, On::Target, EIO, kLonger, kLonger},
    {"flushing the file", SYS_fsync, On::Target, EIO, kLonger, kLonger},
    {"removing the journal", SYS_unlink, On::Others, EROFS, kLonger, kLonger},
};

TEST_F(JournaledWriteTest, AStepThatFailsOrKillsIsReportedAndLeavesTheOldContentOrTheNew)
{
    for (const Step& step : kSteps) {
        for (const bool dies : {false, true}) {
            SCOPED_TRACE(step.name);
            putFile(path(), kOld);
            const unsigned verdict = dies ? SECCOMP_RET_KILL_PROCESS : SECCOMP_RET_ERRNO | step.error;
            EXPECT_EQ(writeBroken(kLonger, step, verdict), dies ? -SIGSYS : 0);
            // What was undone needs no recovery, and everything else is marked as unfinished.
            EXPECT_TRUE(hasJournal(path()) || content() == kOld);
            expectRecovered(dies ? step.afterDeath : step.afterError);
        }
    }
}

}  // namespace
