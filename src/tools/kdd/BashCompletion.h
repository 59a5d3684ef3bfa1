#pragma once

#include <iosfwd>

namespace CLI
{
class App;
}

namespace Kdd
{

/// Writes a script that teaches bash to complete the tool's command lines: commands, options, files and the studies
/// that `kdd list` names. It needs nothing but bash.
void writeBashCompletion(std::ostream& out, const CLI::App& app);

}  // namespace Kdd
