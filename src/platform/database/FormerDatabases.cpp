#include "platform/database/FormerDatabases.h"

#include "platform/database/DatabaseAddress.h"

#include <mutex>
#include <set>

namespace Kxg
{
namespace
{

std::mutex sMutex;

/// As they are shown.
std::set<QString>& all()
{
    static std::set<QString> sAll;
    return sAll;
}

}  // namespace

bool FormerDatabases::has(const DatabaseAddress& address)
{
    const std::lock_guard<std::mutex> lock(sMutex);
    return all().count(address.shown) != 0;
}

void FormerDatabases::add(const DatabaseAddress& address)
{
    const std::lock_guard<std::mutex> lock(sMutex);
    all().insert(address.shown);
}

}  // namespace Kxg
