#include "tools/kdd/ManPage.h"

#include "tools/kdd/HelpText.h"

#include <kddlib/BuildInfo.h>

#include <ostream>

namespace Kdd
{

namespace
{

constexpr const char* kDescription =
    "For every DICOM study one small file, the tag file, holds all attributes of all images, and an image "
    "database knows every file. A study is named by its Study Instance UID or a unique beginning of it.\n"
    ".PP\n"
    "Results go to standard output, progress and faults to standard error. With \\-\\-json standard output "
    "gets one whole JSON value; a command that fails before it has a result writes nothing there.\n";

constexpr const char* kExitStatus = ".SH EXIT STATUS\n"
                                    ".TP\n0\nAll is done.\n"
                                    ".TP\n1\nSomething asked for was not done, or a fault was found.\n"
                                    ".TP\n2\nWrong usage.\n";

constexpr const char* kEnvironment =
    ".SH ENVIRONMENT\n"
    "Options that name a variable take its value where they are not given. All settings of a site are told "
    "in docs/settings.md.\n";

/// As troff prints it unchanged, also where a line begins with it.
std::string escaped(const std::string& text)
{
    std::string result = text.empty() || (text.front() != '.' && text.front() != '\'') ? "" : "\\&";
    for (const char c : text) {
        switch (c) {
        case '\\':
            result += "\\e";
            break;
        case '-':
            result += "\\-";
            break;
        case '\'':
            result += "\\(aq";
            break;
        case '`':
            result += "\\(ga";
            break;
        case '^':
            result += "\\(ha";
            break;
        case '~':
            result += "\\(ti";
            break;
        default:
            result += c;
        }
    }
    return result;
}

void writeOptions(std::ostream& out, const CLI::App& app)
{
    const HelpText help;
    for (const CLI::Option* option : app.get_options()) {
        if (option->get_group().empty())
            continue;  // hidden
        const bool isPositional = !option->nonpositional();
        out << ".TP\n\\fB" << escaped(help.make_option_name(option, isPositional)) << "\\fR"
            << escaped(help.make_option_opts(option)) << '\n'
            << escaped(option->get_description()) << '\n';
    }
}

void writeCommand(std::ostream& out, const CLI::App& command)
{
    const std::string name = "kdd " + command.get_name();
    const std::string usage = HelpText().make_usage(&command, name);
    // The line of the usage without its heading, which the page has of its own.
    out << ".SS " << escaped(name) << '\n'
        << escaped(summaryOf(command)) << ".\n.PP\n"
        << escaped(usage.substr(usage.find(name), usage.find('\n') - usage.find(name))) << "\n.PP\n"
        << escaped(detailsOf(command)) << '\n';
    writeOptions(out, command);
    // Examples stand line by line as they are.
    out << ".PP\n.EX\n" << escaped(command.get_footer()) << "\n.EE\n";
}

}  // namespace

void writeManPage(std::ostream& out, const CLI::App& app)
{
    // Without a date, so that the same sources give the same page.
    out << ".TH KDD 1 \"\" \"" << escaped(BuildInfo::text()) << "\" \"User Commands\"\n.SH NAME\nkdd \\- "
        << escaped(summaryOf(app))
        << "\n.SH SYNOPSIS\n.B kdd\n[\\fIOPTIONS\\fR] \\fICOMMAND\\fR [\\fIARGUMENTS\\fR]\n"
        << ".SH DESCRIPTION\n"
        << kDescription << ".SH OPTIONS\nBefore or after the command.\n";
    writeOptions(out, app);
    out << ".SH COMMANDS\n";
    for (const CLI::App* command : app.get_subcommands({}))
        writeCommand(out, *command);
    out << kExitStatus << kEnvironment;
}

}  // namespace Kdd
