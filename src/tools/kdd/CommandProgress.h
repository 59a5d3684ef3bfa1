#pragma once

#include "tools/kdd/Progress.h"

#include <kddlib/WorkObserver.h>

namespace Kdd
{

/// Shows on the terminal how far work of the archive has come, and ends it when the user interrupts the program: what is
/// being done comes to its end first.
class CommandProgress : public WorkObserver
{
public:
    CommandProgress(const char* what, bool isWanted)
        : mProgress(what, isWanted)
    {
    }

    void progress(qint64 done, qint64 total) override { mProgress.show(done, total); }
    bool isCancelled() override { return wasInterrupted(); }

    /// From here on an interrupt (Ctrl-C, SIGTERM) lets commands come to an orderly end; a second one ends the process.
    static void catchInterrupts();

    static bool wasInterrupted();

private:
    Progress mProgress;
};

/// After an interrupt tells in one line what was finished and that a repeat completes it. Whether there was one.
bool toldOfInterrupt(const char* finished);

}  // namespace Kdd
