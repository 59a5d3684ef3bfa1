#pragma once

#include <iosfwd>

namespace CLI
{
class App;
}

namespace Kdd
{

/// Writes the manual's page of the tool, in the man macros of troff, with a part for each command.
void writeManPage(std::ostream& out, const CLI::App& app);

}  // namespace Kdd
