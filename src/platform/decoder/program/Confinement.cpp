#include "platform/decoder/program/Confinement.h"

#include "platform/os/SystemResult.h"

#include <linux/audit.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstddef>
#include <cstdio>
#include <vector>

namespace Kdd
{
namespace
{

#if defined(__x86_64__)
constexpr unsigned kMachine = AUDIT_ARCH_X86_64;
#elif defined(__aarch64__)
constexpr unsigned kMachine = AUDIT_ARCH_AARCH64;
#else
constexpr unsigned kMachine = 0;  // none for which the calls below have been looked through
#endif

constexpr long long kMostMemory = 4LL << 30;  // beyond what there is at the start [bytes]
constexpr rlim_t kMostSeconds = 900;          // of a processor, of all jobs

/// A filter of system calls, written from the first rule on.
class CallFilter
{
public:
    CallFilter()
    {
        add(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, arch));
        // Calls of another kind of machine have other numbers.
        add(BPF_JMP | BPF_JEQ | BPF_K, kMachine, 1, 0);
        add(BPF_RET | BPF_K, SECCOMP_RET_KILL_PROCESS);
        loadNumber();
    }

    void allow(long call) { answer(call, SECCOMP_RET_ALLOW); }
    void kill(long call) { answer(call, SECCOMP_RET_KILL_PROCESS); }

    /// Only with that number as an argument.
    void allowWith(long call, unsigned argument, unsigned value)
    {
        check(call, argument, BPF_JEQ, value, SECCOMP_RET_ALLOW, refusal());
    }

    /// Only with none of these bits in an argument.
    void allowWithout(long call, unsigned argument, unsigned bits)
    {
        check(call, argument, BPF_JSET, bits, refusal(), SECCOMP_RET_ALLOW);
    }

    Result install()
    {
        // All else fails as if it were forbidden by the rights of files.
        add(BPF_RET | BPF_K, refusal());
        const sock_fprog program = {static_cast<unsigned short>(mRules.size()), mRules.data()};
        return ::prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program) == 0 ? Result()
                                                                           : SystemResult::of(errno);
    }

private:
    static unsigned refusal() { return SECCOMP_RET_ERRNO | EPERM; }

    void add(unsigned code, unsigned value, unsigned char isTrue = 0, unsigned char isFalse = 0)
    {
        mRules.push_back({static_cast<unsigned short>(code), isTrue, isFalse, value});
    }

    void loadNumber() { add(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, nr)); }

    void answer(long call, unsigned action)
    {
        add(BPF_JMP | BPF_JEQ | BPF_K, static_cast<unsigned>(call), 0, 1);
        add(BPF_RET | BPF_K, action);
    }

    // Only the lower half of an argument is looked at: descriptors, protections and commands have no other.
    void check(long call, unsigned argument, unsigned comparison, unsigned value, unsigned whenTrue,
               unsigned whenFalse)
    {
        add(BPF_JMP | BPF_JEQ | BPF_K, static_cast<unsigned>(call), 0, 4);
        add(BPF_LD | BPF_W | BPF_ABS,
            static_cast<unsigned>(offsetof(seccomp_data, args) + argument * sizeof(seccomp_data::args[0])));
        add(BPF_JMP | BPF_K | comparison, value, 0, 1);
        add(BPF_RET | BPF_K, whenTrue);
        add(BPF_RET | BPF_K, whenFalse);
    }

    std::vector<sock_filter> mRules;
};

Result filterCalls()
{
    if (kMachine == 0)
        return Result::failure(QStringLiteral("system calls are not known on this machine"));
    CallFilter filter;
    // The most frequent first.
    filter.allowWith(SYS_recvfrom, 0, kDecoderSocket);
    filter.allowWith(SYS_sendto, 0, kDecoderSocket);
    filter.allowWithout(SYS_mmap, 2, PROT_EXEC);
    filter.allow(SYS_munmap);
    filter.allow(SYS_brk);
    filter.allow(SYS_mremap);
    filter.allow(SYS_madvise);
    filter.allowWithout(SYS_mprotect, 2, PROT_EXEC);
    filter.allow(SYS_futex);
    filter.allow(SYS_clock_gettime);
    filter.allow(SYS_gettimeofday);
    filter.allow(SYS_setitimer);
    // Of its memory, which does not go beyond the hard limit. What the C library calls in place of these could limit other
    // processes of the same user too.
    filter.allowWith(SYS_getrlimit, 0, RLIMIT_AS);
    filter.allowWith(SYS_setrlimit, 0, RLIMIT_AS);
    if (kIsCheckedBuild) {
        // By these checkers find out whether an address may be read, and where a signal's stack is when one is left.
        filter.allow(SYS_sigaltstack);
        filter.allow(SYS_pipe2);
        filter.allow(SYS_write);
        filter.allow(SYS_close);
    }
    // How a process ends, also by abort.
    filter.allow(SYS_exit);
    filter.allow(SYS_exit_group);
    filter.allow(SYS_rt_sigreturn);
    filter.allow(SYS_rt_sigprocmask);
    filter.allow(SYS_rt_sigaction);
    filter.allow(SYS_getpid);
    filter.allow(SYS_gettid);
    filter.allowWith(SYS_tgkill, 0, static_cast<unsigned>(::getpid()));
    // No library does these by habit.
    for (const long call : {SYS_execve,
                            SYS_execveat,
                            SYS_socket,
                            SYS_socketpair,
                            SYS_connect,
                            SYS_bind,
                            SYS_ptrace,
                            SYS_process_vm_writev,
                            SYS_process_vm_readv,
                            SYS_kill,
                            SYS_tkill,
                            SYS_clone,
                            SYS_clone3,
                            SYS_unshare,
                            SYS_setns,
                            SYS_mount,
                            SYS_bpf,
                            SYS_io_uring_setup,
                            SYS_userfaultfd,
                            SYS_memfd_create})
        filter.kill(call);
    return filter.install();
}

bool limit(int what, rlim_t most)
{
    const rlimit both = {most, most};
    return ::setrlimit(static_cast<__rlimit_resource_t>(what), &both) == 0;
}

/// What this process takes of addresses [bytes]; 0 when it is not told.
long long takenMemory()
{
    static const long long kTaken = [] {
        std::FILE* const file = std::fopen("/proc/self/statm", "re");
        long long pages = 0;
        if (file != nullptr) {
            if (std::fscanf(file, "%lld", &pages) != 1)
                pages = 0;
            std::fclose(file);
        }
        return pages * ::sysconf(_SC_PAGESIZE);
    }();
    return kTaken;
}

}  // namespace

void limitMemory(long long bytes)
{
    rlimit both = {};
    if (kIsCheckedBuild || ::syscall(SYS_getrlimit, RLIMIT_AS, &both) != 0)
        return;
    both.rlim_cur =
        std::min(both.rlim_max, static_cast<rlim_t>(takenMemory() + std::min(bytes, kMostMemory)));
    ::syscall(SYS_setrlimit, RLIMIT_AS, &both);
}

// Not by alarm(), which is a system call of some machines only.
void endAfter(long ms)
{
    const itimerval time = {{0, 0}, {ms / 1000, ms % 1000 * 1000}};
    ::setitimer(ITIMER_REAL, &time, nullptr);
}

Result confine()
{
    const bool isLimited =
        takenMemory() > 0 &&
        (kIsCheckedBuild || limit(RLIMIT_AS, static_cast<rlim_t>(takenMemory() + kMostMemory))) &&
        limit(RLIMIT_CORE, 0) && limit(RLIMIT_FSIZE, 0) && limit(RLIMIT_NPROC, 0) &&
        (kIsCheckedBuild || limit(RLIMIT_NOFILE, 0)) && limit(RLIMIT_CPU, kMostSeconds);
    if (!isLimited || ::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0 || ::prctl(PR_SET_DUMPABLE, 0) != 0)
        return Result(SystemResult::of(errno)).within(QStringLiteral("it cannot be confined"));
    return filterCalls().within(QStringLiteral("it cannot be confined"));
}

}  // namespace Kdd
