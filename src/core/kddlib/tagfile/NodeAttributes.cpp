#include "kddlib/tagfile/NodeAttributes.h"

#include "kddlib/tagmodel/OwnAttributes.h"
#include "kddlib/tagmodel/TagElement.h"

#include <algorithm>
#include <iterator>
#include <utility>
#include <vector>

namespace Kdd
{

namespace
{

const DcmTagKey kOfStudy[] = {kFromDatabase};
const DcmTagKey kOfSeries[] = {kHasVolumeFile, kAbstract};
const DcmTagKey kOfBoth[] = {kFromDatabase, kHasVolumeFile, kAbstract};

using Elements = std::vector<std::pair<DcmTagKey, TagElement*>>;

/// Whoever takes them owns them.
Elements takeOfTheNode(TagMap& node)
{
    Elements taken;
    for (const DcmTagKey& key : kOfBoth) {
        if (TagElement* element = node.tagsForLevel().take(key))
            taken.emplace_back(key, element);
    }
    return taken;
}

template <std::size_t n>
void inherit(TagMap& node, const DcmTagKey (&keys)[n])
{
    for (const DcmTagKey& key : keys) {
        const TagElement* own = node.tagsForLevel().value(key, nullptr);
        // Attaching marks what a child lacks. These attributes are said
        // of the node above, and the child shows them.
        if (own != nullptr && own->markedAsMissing())
            node.deleteElement(key);
    }
}

}  // namespace

bool isOfTheNode(const DcmTagKey& key)
{
    return std::find(std::begin(kOfBoth), std::end(kOfBoth), key) != std::end(kOfBoth);
}

void dropOfTheNode(TagMap& image)
{
    for (const DcmTagKey& key : kOfBoth)
        image.deleteElement(key);
}

void holdInSeries(TagMap& study)
{
    for (const DcmTagKey& key : kOfSeries) {
        if (study.tagsForLevel().contains(key))
            study.storeOptionA(key);
    }
}

void attachBelow(TagMap& parent, TagMap* child, TagMap::Level level)
{
    // A first child gives the parent all it has, in place of all that the parent had.
    const Elements kept = parent.children().isEmpty() ? takeOfTheNode(parent) : Elements();
    parent.addChildMap(child, level);
    for (const auto& [key, element] : kept)
        parent.putElement(key, element);
    if (level == TagMap::ImageLevel)
        inherit(*child, kOfBoth);
    else
        inherit(*child, kOfStudy);
}

}  // namespace Kdd
