#pragma once

#include "tools/kdd/Commands.h"

#include <kddlib/Result.h>

namespace Kdd
{

struct DimseRequest;
struct ServeRequest;

/// What commands do that stand on more than the library does: the server, and what draws pictures. It is in a module of the
/// tool, because all that it links would be most of the start of every other command.
struct ToolModule
{
    const char* version;  ///< of the build, which has to be the tool's

    Outcome (*serve)(const GlobalOptions& options, const ServeRequest& request);
    Outcome (*receive)(const GlobalOptions& options, const DimseRequest& request);
    Result (*writeContactSheet)(const QString& folder, const QString& path);
};

/// The module's file, and the only thing that it shows.
constexpr char kToolModuleFile[] = "kdd-tool.so";
constexpr char kToolModule[] = "kddToolModule";

/// Loads it; null, with the reason logged, when it is not there. It stays for the life of the process.
const ToolModule* toolModule();

}  // namespace Kdd
