#include "tools/kdd/CommandProgress.h"

#include <kddlib/LogFile.h>

#include <csignal>

namespace Kdd
{

namespace
{

// The one type that a signal handler may write.
volatile std::sig_atomic_t sInterrupted = 0;

/// Little is allowed in a handler: a mark is set, and a second signal finds the system's own way again.
void noteInterrupt(int signal)
{
    sInterrupted = 1;
    std::signal(signal, SIG_DFL);
}

}  // namespace

void CommandProgress::catchInterrupts()
{
    std::signal(SIGINT, noteInterrupt);
    std::signal(SIGTERM, noteInterrupt);
}

bool CommandProgress::wasInterrupted()
{
    return sInterrupted != 0;
}

bool toldOfInterrupt(const char* finished)
{
    if (!CommandProgress::wasInterrupted())
        return false;
    LogFile::errorf("Interrupted: %s; the same command again completes the rest", finished);
    return true;
}

}  // namespace Kdd
