#pragma once

#include <QtGlobal>

#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>

namespace Kdd
{

/// Whether `life` is true in a process of its own; the signal, negative, when that ended it.
template <typename Life>
int inChild(const Life& life)
{
    int status = 0;
    const pid_t pid = ::fork();
    if (pid == 0)
        ::_exit(life() ? 1 : 0);
    ::waitpid(pid, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
}

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
