#pragma once

#include "kddlib/tagmodel/TagMap.h"

namespace Kdd
{

// What a study and a series say of themselves. The nodes below inherit it and never hold or hide it; it stays where it
// is while images come and go.

/// All of them.
bool isOfTheNode(const DcmTagKey& key);

/// Deletes from an image what its former series and study said of themselves.
void dropOfTheNode(TagMap& image);

/// Gives each series its own part of what the study holds for all of them: another series is about to come.
void holdInSeries(TagMap& study);

/// `TagMap::addChildMap`, but for what the nodes say of themselves: `parent` keeps its own, and a child that is no
/// sequence item inherits what is said above it.
void attachBelow(TagMap& parent, TagMap* child, TagMap::Level level);

}  // namespace Kdd
