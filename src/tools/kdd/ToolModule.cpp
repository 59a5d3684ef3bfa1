#include "tools/kdd/ToolModule.h"

#include <dlfcn.h>
#include <kddlib/BuildInfo.h>
#include <kddlib/LogFile.h>
#include <kddlib/ModuleFile.h>

#include <cstring>

namespace Kdd
{

const ToolModule* toolModule()
{
    void* handle = nullptr;
    const Result opened =
        openModule(QStringLiteral("tool's module"), QLatin1String(kToolModuleFile), moduleFolders(), handle);
    if (opened.bad()) {
        LogFile::errorf("%s", qUtf8Printable(opened.text()));
        return nullptr;
    }
    const auto* module = static_cast<const ToolModule*>(::dlsym(handle, kToolModule));
    if (module != nullptr && std::strcmp(module->version, BuildInfo::text()) == 0)
        return module;
    LogFile::errorf("The tool's module %s is of another version", kToolModuleFile);
    return nullptr;
}

}  // namespace Kdd
