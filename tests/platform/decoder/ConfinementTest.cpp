#include "platform/decoder/program/Confinement.h"

#include "support/Process.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/socket.h>

#include <cerrno>
#include <cstdlib>

using namespace Kdd;

namespace
{

bool isForbidden(long outcome)
{
    return outcome == -1 && errno == EPERM;
}

/// Memory of which each page is there.
bool canTake(std::size_t size)
{
    void* const memory = ::mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
    return memory != MAP_FAILED;
}

/// What is tried, and the outcome: 1 where what it says holds; -SIGSYS where the attempt ends the process.
const std::tuple<const char*, bool (*)(), int> kAttempts[] = {
    {"ReadAFile", [] { return isForbidden(::open("/etc/passwd", O_RDONLY | O_CLOEXEC)); }, 1},
    {"WriteAFile",
     [] { return isForbidden(::open("/tmp/kdd-confined", O_WRONLY | O_CREAT | O_CLOEXEC, 0600)); }, 1},
    {"RemoveAFile", [] { return isForbidden(::unlink("/tmp/kdd-not-there")); }, 1},
    {"AskForAFile", [] { return isForbidden(::access("/etc", F_OK)); }, 1},
    {"ReadAnotherDescriptor",
     [] {
         char byte = 0;
         return isForbidden(::recv(5, &byte, 1, 0));
     },
     1},
    {"WriteToAnotherDescriptor",
     [] { return (kIsCheckedBuild || isForbidden(::write(1, "x", 1))) && isForbidden(::send(1, "x", 1, 0)); },
     1},
    {"DuplicateADescriptor", [] { return isForbidden(::dup(0)); }, 1},
    {"RunMemory",
     [] {
         return isForbidden(
             ::mmap(nullptr, 4096, PROT_READ | PROT_EXEC, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0) == MAP_FAILED
                 ? -1
                 : 0);
     },
     1},
    {"RaiseItsLimits",
     [] {
         const rlimit more = {1, RLIM_INFINITY};
         return isForbidden(::setrlimit(RLIMIT_CPU, &more));
     },
     1},
    {"LimitItsParent",
     [] {
         const rlimit less = {1 << 20, 1 << 20};
         return isForbidden(::prlimit(::getppid(), RLIMIT_AS, &less, nullptr));
     },
     1},
    {"OpenASocket", [] { return ::socket(AF_INET, SOCK_STREAM, 0) >= 0; }, -SIGSYS},
    {"StartAProgram", [] { return ::execl("/bin/true", "true", nullptr) == 0; }, -SIGSYS},
    {"CopyItself", [] { return ::fork() >= 0; }, -SIGSYS},
    {"EndItsParent", [] { return ::kill(::getppid(), 0) == 0; }, -SIGSYS},
    {"TakeMemory", [] { return canTake(1 << 20); }, 1},
    {"WorkWithoutEnd",
     [] {
         endAfter(1);
         for (volatile bool goesOn = true; goesOn;) {
         }
         return true;
     },
     -SIGALRM},
    {"EndByAbort", []() -> bool { std::abort(); }, -SIGABRT},
};

TEST(Confinement, LeavesNothingButMemoryAndTheSocket)
{
    EXPECT_EQ(inChild([] { return confine().good(); }), 1);
    for (const auto& [name, attempt, outcome] : kAttempts)
        EXPECT_EQ(inChild([tries = attempt] { return confine().good() && tries(); }), outcome) << name;
}

TEST(Confinement, BoundsMemoryForEachJob)
{
    if (kIsCheckedBuild)
        GTEST_SKIP() << "Checkers of memory need more of it";
    EXPECT_EQ(inChild([] {
                  const bool isConfined = confine().good();
                  limitMemory(64 << 20);
                  const bool isSmall = canTake(32 << 20) && !canTake(64 << 20);
                  // The next job may have more, but none as much as it likes.
                  limitMemory(1LL << 40);
                  return isConfined && isSmall && canTake(std::size_t(1) << 30) &&
                         !canTake(std::size_t(5) << 30);
              }),
              1);
}

}  // namespace
