#pragma once

namespace Kxg
{

struct DatabaseAddress;

/// The databases that this process had open. One of them that is gone is in other hands, being moved or restored, or lies
/// on a disk that fell away: an empty one in its place would tell that there are no studies, and take what comes. May be
/// used on any thread.
class FormerDatabases
{
public:
    static bool has(const DatabaseAddress& address);
    static void add(const DatabaseAddress& address);
};

}  // namespace Kxg
