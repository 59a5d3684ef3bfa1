#include "server/Server.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/Report.h"

#include <kddlib/LogFile.h>

#include <csignal>
#include <cstdio>
#include <memory>
#include <stdexcept>

namespace Kdd
{

namespace
{

struct ServeRequest
{
    QByteArray listen = "127.0.0.1:8042";
};

/// While it lives the signals that end a process wait to be asked for, by threads that are started meanwhile too.
class EndSignals
{
public:
    EndSignals()
    {
        sigemptyset(&mSignals);
        sigaddset(&mSignals, SIGINT);
        sigaddset(&mSignals, SIGTERM);
        ::pthread_sigmask(SIG_BLOCK, &mSignals, &mFormer);
    }
    ~EndSignals() { ::pthread_sigmask(SIG_SETMASK, &mFormer, nullptr); }
    EndSignals(const EndSignals&) = delete;
    EndSignals& operator=(const EndSignals&) = delete;

    /// Returns with the first one; a second one ends the process.
    void await() const
    {
        int signal = 0;
        ::sigwait(&mSignals, &signal);
        std::signal(SIGINT, SIG_DFL);
        std::signal(SIGTERM, SIG_DFL);
        ::pthread_sigmask(SIG_UNBLOCK, &mSignals, nullptr);
    }

private:
    sigset_t mSignals = {};
    sigset_t mFormer = {};
};

void tellAddress(const GlobalOptions& options, const Server& server)
{
    const QString address = QString::fromLatin1(server.address());
    if (options.json)
        printJson({{QStringLiteral("address"), address}});
    else
        std::printf("Serving at %s\n", qUtf8Printable(address));
    std::fflush(stdout);
}

Outcome runServe(const GlobalOptions& options, const ServeRequest& request)
{
    ServerSettings settings;
    if (!Http::ListenAddress::parse(request.listen, settings.http.address)) {
        LogFile::errorf("%s is no address to listen at: write 127.0.0.1:8042 or [::1]:8042",
                        request.listen.constData());
        return Outcome::WrongUsage;
    }
    const EndSignals end;
    Server server(settings);
    const Result started = server.start();
    if (started.bad()) {
        LogFile::errorf("Cannot serve: %s", qUtf8Printable(started.text()));
        return Outcome::Failed;
    }
    tellAddress(options, server);
    end.await();
    server.stop();
    return Outcome::Done;
}

}  // namespace

void declareServe(CommandSet& commands)
{
    const CommandText text = {"serve", kLooking, "Answer DICOMweb requests over HTTP",
                              "Runs until it is interrupted; requests in flight are answered before it ends.",
                              "kdd serve"};
    const auto request = std::make_shared<ServeRequest>();
    ArgumentList arguments = commands.declare(
        text, [request](const GlobalOptions& options) { return runServe(options, *request); });
    arguments.text({"--listen", "ADDRESS:PORT", "Where to wait for requests (default: 127.0.0.1:8042)"},
                   request->listen);
}

}  // namespace Kdd
