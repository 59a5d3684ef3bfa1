#include "support/TreeText.h"

#include "kddlib/tagfile/TagFile.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"

#include <cstdio>

namespace Kdd
{

namespace
{

std::string line(int indent, const DcmTagKey& key, const TagElement& element)
{
    char start[64];
    std::snprintf(start, sizeof start, "%*s%04x,%04x %u ", indent, "", unsigned(key.getGroup()),
                  unsigned(key.getElement()), static_cast<unsigned>(element.vr()));
    const QByteArray value = isTextVr(element.vr()) ? element.value() : element.value().toHex();
    return start + value.toStdString() + '\n';
}

using Lines = std::string (*)(const TagMap& node, int indent);

/// A line for the element and, for a sequence, what `lines` makes of its items.
std::string entry(int indent, const DcmTagKey& key, const TagElement& element, Lines lines)
{
    std::string text = line(indent, key, element);
    if (!element.isSequence())
        return text;
    const auto& sequence = static_cast<const TagSequence&>(element);
    for (int i = 0; i < sequence.numItems(); ++i)
        text += std::string(static_cast<std::size_t>(indent) + 1, ' ') + "item\n" +
                lines(*sequence.item(i), indent + 2);
    return text;
}

std::string shown(const TagMap& node, int indent)
{
    std::string text;
    const TagMap::iterator end = node.end();
    for (TagMap::iterator it = node.begin(); it != end; ++it)
        text += entry(indent, it.key(), *it.value(), shown);
    return text;
}

std::string own(const TagMap& node, int indent)
{
    std::string text;
    for (auto it = node.tagsForLevel().cbegin(); it != node.tagsForLevel().cend(); ++it)
        text += entry(indent, it.key(), *it.value(), own);
    return text;
}

std::string tree(const TagMap& node, int depth)
{
    std::string text = "node at level " + std::to_string(3 - depth) + '\n' + own(node, depth + 1);
    for (const TagMap* child : node.children())
        text += tree(*child, depth + 1);
    return text;
}

}  // namespace

std::string shownText(const TagMap& node)
{
    return shown(node, 0);
}

std::string ownText(const TagMap& node)
{
    return own(node, 0);
}

std::string treeText(const TagFile& file)
{
    return file.study() != nullptr ? tree(*file.study(), 0) : std::string("empty\n");
}

std::string imagesText(const TagFile& file)
{
    std::string text;
    for (auto it = file.imagesByUID().cbegin(); it != file.imagesByUID().cend(); ++it)
        text += "image " + it.key().toStdString() + '\n' + shown(*it.value(), 1);
    return text;
}

}  // namespace Kdd
