#include "support/TreeText.h"

#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/TagMap.h"

namespace Kdd
{

namespace
{

std::string tree(const TagMap& node, int depth)
{
    std::string text = "node at level " + std::to_string(3 - depth) + '\n' + ownText(node, depth + 1);
    for (const TagMap* child : node.children())
        text += tree(*child, depth + 1);
    return text;
}

}  // namespace

std::string treeText(const TagFile& file)
{
    return file.study() != nullptr ? tree(*file.study(), 0) : std::string("empty\n");
}

std::string imagesText(const TagFile& file)
{
    std::string text;
    for (auto it = file.imagesByUID().cbegin(); it != file.imagesByUID().cend(); ++it)
        text += "image " + it.key().toStdString() + '\n' + shownText(*it.value(), 1);
    return text;
}

}  // namespace Kdd
