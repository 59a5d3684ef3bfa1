#include "tools/kdd/ServerSignals.h"

#include <fcntl.h>
#include <kddlib/LogFile.h>
#include <kddlib/ModuleFile.h>
#include <unistd.h>

namespace Kdd
{

namespace
{

/// Whether the process would go with a terminal that is closed. nohup has that signal ignored.
bool belongsToTerminal()
{
    struct sigaction action = {};
    const int terminal = ::open("/dev/tty", O_RDONLY | O_CLOEXEC | O_NOCTTY);
    if (terminal >= 0)
        ::close(terminal);
    return terminal >= 0 && ::sigaction(SIGHUP, nullptr, &action) == 0 && action.sa_handler == SIG_DFL;
}

/// One that came before was taken note of by the handler that commands have, which lets go of the signal then. It is not
/// asked whether it did: a module of the tool has no part in that.
bool cameBefore(int signal)
{
    struct sigaction handler = {};
    return ::sigaction(signal, nullptr, &handler) == 0 && handler.sa_handler == SIG_DFL;
}

}  // namespace

ServerSignals::ServerSignals()
{
    sigemptyset(&mSignals);
    sigaddset(&mSignals, SIGINT);
    sigaddset(&mSignals, SIGTERM);
    if (!belongsToTerminal())
        sigaddset(&mSignals, SIGHUP);
    ::pthread_sigmask(SIG_BLOCK, &mSignals, &mFormer);
    mIsOver = cameBefore(SIGINT) || cameBefore(SIGTERM);
}

ServerSignals::~ServerSignals()
{
    ::pthread_sigmask(SIG_SETMASK, &mFormer, nullptr);
}

void ServerSignals::awaitEnd(const std::function<void()>& renew) const
{
    for (int signal = mIsOver ? SIGTERM : SIGHUP; signal == SIGHUP;) {
        ::sigwait(&mSignals, &signal);
        if (signal == SIGHUP)
            renew();
    }
    std::signal(SIGINT, SIG_DFL);
    std::signal(SIGTERM, SIG_DFL);
    ::pthread_sigmask(SIG_UNBLOCK, &mSignals, nullptr);
}

void loadForLongRun()
{
    if (const Result result = loadModules(); result.bad())
        LogFile::warnf("%s", qUtf8Printable(result.text()));
}

void renewCertificate(bool hasCertificate, const std::function<Result()>& renew)
{
    if (!hasCertificate)
        return LogFile::printf("There is no certificate to be read anew: TLS is not in use");
    const Result result = renew();
    if (result.bad())
        LogFile::errorf("The former certificate stays in use: %s", qUtf8Printable(result.text()));
    else
        LogFile::printf("Certificate and key were read anew");
}

}  // namespace Kdd
