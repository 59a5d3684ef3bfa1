#pragma once

#include <QtGlobal>

#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <stdexcept>

namespace Kdd
{

/// What `life` gives, up to 255, in a process of its own; the signal, negative, when that ended it.
template <typename Life>
int inChild(const Life& life)
{
    int status = 0;
    const pid_t pid = ::fork();
    if (pid == 0)
        ::_exit(static_cast<int>(life()));
    ::waitpid(pid, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
}

/// Another process in which `life` was true, and which does nothing more until it is killed at the end of this object.
class StoppedProcess
{
public:
    template <typename Life>
    explicit StoppedProcess(const Life& life)
        : mPid(::fork())
    {
        if (mPid == 0) {
            ::prctl(PR_SET_PDEATHSIG, SIGKILL);
            ::_exit(life() && ::raise(SIGSTOP) == 0 ? 0 : 1);
        }
        int status = 0;
        if (::waitpid(mPid, &status, WUNTRACED) != mPid || !WIFSTOPPED(status))
            throw std::runtime_error("The other process did not come to its stop");
    }
    ~StoppedProcess()
    {
        ::kill(mPid, SIGKILL);
        ::waitpid(mPid, nullptr, 0);
    }
    StoppedProcess(const StoppedProcess&) = delete;
    StoppedProcess& operator=(const StoppedProcess&) = delete;

private:
    pid_t mPid;
};

/// While it lives no file of this process can grow beyond a size, as if the disk were full.
class FullDisk
{
public:
    explicit FullDisk(qint64 size)
        : mFormerAction(std::signal(SIGXFSZ, SIG_IGN))
    {
        ::getrlimit(RLIMIT_FSIZE, &mFormer);
        const rlimit limit = {static_cast<rlim_t>(size), mFormer.rlim_max};
        ::setrlimit(RLIMIT_FSIZE, &limit);
    }
    ~FullDisk()
    {
        ::setrlimit(RLIMIT_FSIZE, &mFormer);
        std::signal(SIGXFSZ, mFormerAction);
    }
    FullDisk(const FullDisk&) = delete;
    FullDisk& operator=(const FullDisk&) = delete;

private:
    sighandler_t mFormerAction;
    rlimit mFormer = {};
};

}  // namespace Kdd
