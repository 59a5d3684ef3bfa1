#include "tools/kdd/Commands.h"

#include <QFile>

#include <CLI/CLI.hpp>
#include <kddlib/PathName.h>

#include <stdexcept>

namespace Kdd
{

namespace
{

QByteArray bytes(const std::string& text)
{
    return {text.data(), static_cast<int>(text.size())};
}

void present(CLI::Option& option, const Argument& argument)
{
    // The kind is what help, manual and completion tell of the value.
    option.type_name(argument.kind);
    option.required(argument.isRequired);
}

}  // namespace

QString pathOf(const QByteArray& text)
{
    if (!isPlainText(text))
        throw std::invalid_argument("The name " + text.toStdString() +
                                    " is no text in the encoding of the locale");
    return QFile::decodeName(text);
}

void ArgumentList::flag(const char* name, bool& value, const char* what)
{
    mCommand.add_flag(name, value, what);
}

void ArgumentList::number(const char* name, int least, int greatest, int& value, const char* what)
{
    // The parser refuses what lies outside, so no command checks its numbers itself.
    CLI::Range range(least, greatest);
    range.description("");  // the kind tells it already
    const std::string kind = std::to_string(least) + '-' + std::to_string(greatest);
    mCommand.add_option(name, value, what)->check(range)->type_name(kind);
}

void ArgumentList::number(const char* name, unsigned& value, const char* what)
{
    mCommand.add_option(name, value, what)->type_name("NUMBER");
}

void ArgumentList::text(const Argument& argument, QByteArray& value)
{
    const auto keep = [&value](const std::string& text) { value = bytes(text); };
    present(*mCommand.add_option_function<std::string>(argument.name, keep, argument.what), argument);
}

void ArgumentList::texts(const Argument& argument, QList<QByteArray>& values, const char* shownAs)
{
    const auto keep = [&values](const std::vector<std::string>& texts) {
        for (const std::string& text : texts)
            values.append(bytes(text));
    };
    CLI::Option* option =
        mCommand.add_option_function<std::vector<std::string>>(argument.name, keep, argument.what);
    present(*option, argument);
    if (shownAs != nullptr)
        option->option_text(shownAs);
}

void ArgumentList::path(const Argument& argument, QString& value)
{
    const auto keep = [&value](const std::string& text) { value = pathOf(bytes(text)); };
    present(*mCommand.add_option_function<std::string>(argument.name, keep, argument.what), argument);
}

ArgumentList CommandSet::declare(const CommandText& text, const Run& run)
{
    // The parser knows one text for both; summaryOf and detailsOf take it apart again.
    CLI::App* command = mApp.add_subcommand(text.name, std::string(text.summary) + "\n\n" + text.details);
    command->group(text.group);
    command->footer(text.examples);
    // The options of every command may stand behind its name, too.
    command->fallthrough();
    // Run later, when the whole line is read and the global options are in force.
    command->callback([&chosen = mChosen, run] { chosen = run; });
    return ArgumentList(*command);
}

}  // namespace Kdd
