#pragma once

#include <QByteArray>
#include <QList>
#include <QString>

#include <functional>

namespace CLI
{
class App;
}

namespace Kdd
{

/// What every command is told.
struct GlobalOptions
{
    bool json = false;     ///< one machine-readable result on standard output
    bool quiet = false;    ///< no progress, only errors
    bool flush = false;    ///< written files are on disk before they count as written
    bool verbose = false;  ///< names everything that is passed over
    QString store;         ///< the folder of everything that is kept

    /// Folder of the volume files that are made here.
    QString volumeFolder() const { return store + QStringLiteral("/volumes"); }

    /// Of the objects that arrive over a network, where the site's settings do not name another one.
    QString objectFolder() const { return store + QStringLiteral("/objects"); }
};

/// How a command ends; the numbers are the exit codes.
///
/// With `--json` standard output gets one whole JSON value. A command that fails before it has a result writes nothing
/// there; one that fails in part writes the result with what failed counted. Reasons go to standard error only.
enum class Outcome {
    Done = 0,
    Failed = 1,  ///< something asked for was not done, or a fault was found
    WrongUsage = 2,
};

/// What a value is: shown by the help and the manual, and what the shell completes. Alternatives are separated by "|";
/// those in small letters are words of their own.
constexpr const char* kText = "TEXT";
constexpr const char* kUid = "UID";
constexpr const char* kStudy = "STUDY";  ///< Study Instance UID, or a unique beginning of it
constexpr const char* kFile = "FILE";
constexpr const char* kFolder = "DIR";
constexpr const char* kPath = "PATH";  ///< file or folder
constexpr const char* kUrl = "URL";
constexpr const char* kListenAddress = "ADDRESS:PORT";
constexpr const char* kStudyOrFile = "STUDY|FILE";
constexpr const char* kStudiesAndFolder = "STUDY|DIR";

struct Argument
{
    const char* name;  ///< "--option", or the name of a value that goes without one
    const char* kind;
    const char* what;
    bool isRequired = false;
};

/// The arguments of one command. What they are read into has to be there until the command line is parsed.
class ArgumentList
{
public:
    explicit ArgumentList(CLI::App& command)
        : mCommand(command)
    {
    }

    void flag(const char* name, bool& value, const char* what);
    void number(const char* name, int least, int greatest, int& value, const char* what);
    void number(const char* name, unsigned& value, const char* what);
    void text(const Argument& argument, QByteArray& value);

    /// One or more; `shownAs` takes the place of the argument's name in the help where that says more.
    void texts(const Argument& argument, QList<QByteArray>& values, const char* shownAs = nullptr);

    /// A file's name; std::invalid_argument, while the command line is parsed, when it would lead to another file.
    void path(const Argument& argument, QString& value);

private:
    CLI::App& mCommand;
};

/// How a command presents itself. Help, manual and completion are made from this and from its arguments.
struct CommandText
{
    const char* name;
    const char* group;    ///< heading under which the help lists it
    const char* summary;  ///< one line
    const char* details;  ///< what else a user has to know, as running text
    const char*
        examples;  ///< lines "kdd ...   # what for", each one that works on an archive of sample studies
};

constexpr const char* kTaking = "Take images in";
constexpr const char* kChanging = "Change what is stored";
constexpr const char* kLooking = "Look at what is stored";
constexpr const char* kChecking = "Check and compare";
constexpr const char* kTransfers = "Transfer files";
constexpr const char* kServing = "Serve what is stored";
constexpr const char* kTrying = "Try it out";

/// Where commands declare themselves.
class CommandSet
{
public:
    using Run = std::function<Outcome(const GlobalOptions&)>;

    /// Both outlive this object; `chosen` receives what the command line asks for.
    CommandSet(CLI::App& app, Run& chosen)
        : mApp(app)
        , mChosen(chosen)
    {
    }

    ArgumentList declare(const CommandText& text, const Run& run);

private:
    CLI::App& mApp;
    Run& mChosen;
};

/// Declares every command there is.
void declareCommands(CommandSet& commands);

/// As the locale has it. std::invalid_argument when it is no text there and would lead to another file.
QString pathOf(const QByteArray& text);

}  // namespace Kdd
