#include "platform/late/LateLibrary.h"

#include "platform/late/LateTable.h"
#include "platform/os/ModuleFile.h"

#include <dlfcn.h>

#include <cstring>
#include <mutex>
#include <stdexcept>
#include <vector>

namespace Kdd
{
namespace
{

struct Loading
{
    std::once_flag once;
    Result result;
};

/// Never destroyed, because when the process ends other threads may still call.
Loading& loadingOf(const LateTable& table)
{
    static auto* const all = new std::vector<Loading>(kLateTableCount);
    return (*all)[static_cast<std::size_t>(&table - kLateTables)];
}

Result bind(const LateTable& table)
{
    const QString title = QStringLiteral("module");
    void* handle = nullptr;
    Result result = openModule(title, QLatin1String(table.file), moduleFolders(), handle);
    if (result.bad())
        return result;
    const auto* module = static_cast<const LateModule*>(::dlsym(handle, kLateModule));
    // One of another build has its functions in other places.
    if (module == nullptr || std::strcmp(module->digest, table.digest) != 0)
        return Result::failure(
            QStringLiteral("The module %1 is of another version").arg(QLatin1String(table.file)));
    // Each at once: other threads jump meanwhile.
    for (std::size_t i = 0; i < table.count; ++i)
        __atomic_store_n(&kddLateCalls[table.first + i], module->functions[i], __ATOMIC_RELEASE);
    return {};
}

const Result& load(const LateTable& table)
{
    Loading& loading = loadingOf(table);
    std::call_once(loading.once, [&] { loading.result = bind(table); });
    return loading.result;
}

}  // namespace

Result loadLate(LateLibrary library)
{
    for (std::size_t i = 0; i < kLateTableCount; ++i) {
        if (kLateTables[i].library == library)
            return load(kLateTables[i]);
    }
    return {};
}

Result loadModules()
{
    Result first;
    for (std::size_t i = 0; i < kLateTableCount; ++i) {
        const Result& result = load(kLateTables[i]);
        if (first.good())
            first = result;
    }
    return first;
}

}  // namespace Kdd

/// The address of a function that is called for the first time.
extern "C" void* kddBindLateCall(std::size_t place)
{
    using namespace Kdd;
    for (std::size_t i = 0; i < kLateTableCount; ++i) {
        const LateTable& table = kLateTables[i];
        if (place - table.first >= table.count)
            continue;
        if (const Result& result = load(table); result.bad())
            throw std::runtime_error(result.text().toStdString());
    }
    return kddLateCalls[place];
}
