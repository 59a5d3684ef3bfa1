#pragma once

#include <CLI/CLI.hpp>

namespace Kdd
{

/// The help as `kdd --help` and `kdd COMMAND --help` show it.
class HelpText : public CLI::Formatter
{
public:
    std::string make_description(const CLI::App* app) const override;
    std::string make_option_opts(const CLI::Option* option) const override;
    std::string make_subcommand(const CLI::App* command) const override;
    std::string make_footer(const CLI::App* app) const override;
};

/// The first line of a description, and what follows it after an empty one.
std::string summaryOf(const CLI::App& command);
std::string detailsOf(const CLI::App& command);

/// What a value of an option is; empty for one without a value.
std::string kindOf(const CLI::Option& option);

}  // namespace Kdd
