#include "tools/kdd/BashCompletion.h"
#include "tools/kdd/CommandProgress.h"
#include "tools/kdd/Commands.h"
#include "tools/kdd/GlobalArguments.h"
#include "tools/kdd/HelpText.h"
#include "tools/kdd/ManPage.h"

#include <QThread>

#include <CLI/CLI.hpp>
#include <kddlib/LogFile.h>

#include <cstdio>
#include <exception>
#include <iostream>

namespace Kdd
{

namespace
{

constexpr const char* kAbout = "Tag files: the metadata cache of a medical-imaging server";
constexpr const char* kMore = "kdd COMMAND --help tells what a command does, with examples.";

/// A result that could not be written is none.
Outcome whenWritten(Outcome outcome)
{
    if (std::fflush(stdout) == 0 && std::ferror(stdout) == 0)
        return outcome;
    LogFile::errorf("Standard output cannot be written");
    return Outcome::Failed;
}

/// What the build makes of the commands' own descriptions, so that neither can say anything else than the help.
Outcome writeFor(const std::string& reader, const CLI::App& app)
{
    if (reader == "man")
        writeManPage(std::cout, app);
    else
        writeBashCompletion(std::cout, app);
    std::cout.flush();
    return Outcome::Done;
}

Outcome run(int argc, char** argv)
{
    CLI::App app(kAbout, "kdd");
    // The options of the tool may stand behind the command as well.
    app.fallthrough();
    app.formatter(std::make_shared<HelpText>());
    app.footer(kMore);
    GlobalArguments global;
    global.addTo(app);
    std::string reader;
    // For the build alone; without a group the help does not show it.
    app.add_option("--describe-for", reader)->check(CLI::IsMember({"man", "bash"}))->group("");
    CommandSet::Run chosen;
    CommandSet commands(app, chosen);
    declareCommands(commands);
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& fault) {
        // Help and version end the parsing like an error, but with 0.
        return app.exit(fault) == 0 ? Outcome::Done : Outcome::WrongUsage;
    }
    // It comes without a command.
    if (!reader.empty())
        return whenWritten(writeFor(reader, app));
    if (!chosen) {
        std::fprintf(stderr, "kdd: name a command; kdd --help lists them\n");
        return Outcome::WrongUsage;
    }
    const GlobalOptions& options = global.apply();
    // Until here an interrupt simply ends the process.
    CommandProgress::catchInterrupts();
    return whenWritten(chosen(options));
}

}  // namespace

}  // namespace Kdd

int main(int argc, char** argv)
{
    // Qt takes the thread that it sees first for the main one, and keeps what belongs to any other until that thread ends:
    // a server's worker must not come first.
    QThread::currentThread();
    try {
        return static_cast<int>(Kdd::run(argc, argv));
    } catch (const std::exception& fault) {
        // Whatever nobody reckoned with ends the tool with its reason.
        std::fprintf(stderr, "kdd: %s\n", fault.what());
        return static_cast<int>(Kdd::Outcome::Failed);
    }
}
