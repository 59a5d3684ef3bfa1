#include "tools/kdd/HelpText.h"

#include <sstream>

namespace Kdd
{

namespace
{

constexpr std::size_t kWidth = 100;  // [characters]

std::string wrapped(const std::string& text)
{
    std::istringstream words(text);
    std::string lines;
    std::string word;
    for (std::size_t column = 0; words >> word; column += word.size()) {
        // A word that does not fit together with the blank before it begins a line.
        const bool isNewLine = column > 0 && column + 1 + word.size() > kWidth;
        if (column > 0)
            lines += isNewLine ? '\n' : ' ';
        column = isNewLine ? 0 : column + (column > 0 ? 1 : 0);
        lines += word;
    }
    return lines;
}

std::string indented(const std::string& lines)
{
    return "  " + CLI::detail::find_and_replace(lines, "\n", "\n  ");
}

}  // namespace

std::string HelpText::make_description(const CLI::App* app) const
{
    // The tool itself has a summary only.
    const std::string details = detailsOf(*app);
    return summaryOf(*app) + "\n" + (details.empty() ? "" : "\n" + wrapped(details) + "\n\n");
}

std::string HelpText::make_option_opts(const CLI::Option* option) const
{
    // What a positional argument is, its name says; whether there may be several, the line on usage.
    if (!option->get_positional() || !option->get_option_text().empty())
        return Formatter::make_option_opts(option);
    return option->get_required() ? " (required)" : "";
}

std::string HelpText::make_subcommand(const CLI::App* command) const
{
    std::ostringstream out;
    // The list of commands has the summaries only; the details come with a command's own help.
    CLI::detail::format_help(out, command->get_name(), summaryOf(*command), get_column_width());
    return out.str();
}

std::string HelpText::make_footer(const CLI::App* app) const
{
    // The tool as a whole has a hint there and no examples.
    if (app->get_parent() == nullptr)
        return app->get_footer() + "\n";
    return "Examples:\n" + indented(app->get_footer()) +
           "\n\nkdd --help tells the options that every command takes.\n";
}

std::string summaryOf(const CLI::App& command)
{
    const std::string text = command.get_description();
    return text.substr(0, text.find('\n'));
}

std::string detailsOf(const CLI::App& command)
{
    const std::string text = command.get_description();
    const std::size_t end = text.find("\n\n");
    return end == std::string::npos ? std::string() : text.substr(end + 2);
}

std::string kindOf(const CLI::Option& option)
{
    // A flag has no value, though the parser may have a name for its type.
    return option.get_type_size() == 0 ? std::string() : option.get_type_name();
}

}  // namespace Kdd
