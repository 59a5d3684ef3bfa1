#include "kddlib/tagmodel/TagElement.h"
#include "kddlib/tagmodel/TagMap.h"

#include <cstdio>

namespace Kdd
{

namespace
{

/// Groups of the system's own attributes and of its audit trail.
bool isOwnGroup(const DcmTagKey& key)
{
    return key.getGroup() == 0x0006 || key.getGroup() == 0x0071;
}

void skipOwnGroups(TagMap::iterator& it, const TagMap::iterator& end)
{
    while (it != end && isOwnGroup(it.key()))
        ++it;
}

std::string text(const DcmTagKey& key)
{
    char buffer[16];
    std::snprintf(buffer, sizeof buffer, "(%04x,%04x) ", unsigned(key.getGroup()),
                  unsigned(key.getElement()));
    return buffer;
}

std::string text(const TagMap::iterator& it)
{
    return text(it.key()) + vrName(it.value()->vr());
}

void append(std::string* diffs, const std::string& line)
{
    if (diffs != nullptr)
        diffs->append(line);
}

}  // namespace

/// Both views are in key order and are walked side by side, so a key that
/// only one of them has is met there at once.
bool TagMap::compare(const TagMap& other, bool strict, std::string* diffs) const
{
    const iterator last = end();
    iterator mine = begin();
    iterator theirs = other.begin();
    while (true) {
        if (!strict) {
            skipOwnGroups(mine, last);
            skipOwnGroups(theirs, last);
        }
        if (mine == last && theirs == last)
            return true;
        if (mine == last || theirs == last) {
            append(diffs, text(mine != last ? mine : theirs) + " Missing tag\n");
            return false;
        }
        // The walks are not brought together again: one line of what differs first is what callers show.
        if (mine.key() != theirs.key()) {
            append(diffs, text(mine) + " <> " + text(theirs) + "\n");
            return false;
        }
        // Only the value of a private attribute is passed over. That one side lacks it has been found above.
        const bool isPassedOver = !strict && (mine.key().getGroup() & 1) != 0;
        if (!isPassedOver && !mine.value()->compare(*theirs.value(), strict, diffs)) {
            if (diffs != nullptr)
                diffs->insert(0, text(mine.key()));
            return false;
        }
        ++mine;
        ++theirs;
    }
}

}  // namespace Kdd
