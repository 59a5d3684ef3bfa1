// What nothing can be faster than on a machine:
//     peer_floor                    a process that does nothing
//     peer_floor heads FOLDER       the first 16 KiB of each file, as they come from the page cache
//     peer_floor inflate FILE       a gzip file, decompressed
//     peer_floor time COMMAND...    starts the command, whose output goes nowhere, and tells what it took: wall-clock and
//                                   processor time [ms], peak memory [KiB], exit code. A process counts what the one that
//                                   started it had in memory, so that one has to be small.

#include "FilesBelow.h"
#include "GzipFile.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>

namespace
{

double millisecondsOf(const timeval& time)
{
    return static_cast<double>(time.tv_sec) * 1e3 + static_cast<double>(time.tv_usec) / 1e3;
}

int timeOf(char* argv[])
{
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, "/dev/null", O_WRONLY, 0);
    const auto start = std::chrono::steady_clock::now();
    pid_t child = 0;
    int status = 0;
    rusage usage = {};
    if (posix_spawnp(&child, argv[0], &actions, nullptr, argv, environ) != 0 ||
        wait4(child, &status, 0, &usage) != child)
        return 1;
    const std::chrono::duration<double, std::milli> wall = std::chrono::steady_clock::now() - start;
    posix_spawn_file_actions_destroy(&actions);
    std::printf("%.3f %.3f %ld %d\n", wall.count(),
                millisecondsOf(usage.ru_utime) + millisecondsOf(usage.ru_stime), usage.ru_maxrss,
                WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status));
    return 0;
}

bool readHeads(const char* folder)
{
    constexpr std::size_t kHead = 16 * 1024;
    std::string head(kHead, '\0');
    for (const std::string& path : filesBelow(folder)) {
        const int file = open(path.c_str(), O_RDONLY | O_CLOEXEC);
        if (file < 0)
            return false;
        const bool isRead = read(file, head.data(), head.size()) >= 0;
        close(file);
        if (!isRead)
            return false;
    }
    return true;
}

}  // namespace

int main(int argc, char* argv[])
{
    if (argc < 3)
        return 0;
    const std::string what = argv[1];
    if (what == "time")
        return timeOf(argv + 2);
    const bool isDone = what == "inflate" ? !inflatedOf(argv[2], 0).empty() : readHeads(argv[2]);
    return isDone ? 0 : 1;
}
