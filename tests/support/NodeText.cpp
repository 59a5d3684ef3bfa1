#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"
#include "support/TreeText.h"

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

}  // namespace

std::string shownText(const TagMap& node, int indent)
{
    std::string text;
    const TagMap::iterator end = node.end();
    for (TagMap::iterator it = node.begin(); it != end; ++it)
        text += entry(indent, it.key(), *it.value(), shownText);
    return text;
}

std::string ownText(const TagMap& node, int indent)
{
    std::string text;
    for (auto it = node.tagsForLevel().cbegin(); it != node.tagsForLevel().cend(); ++it)
        text += entry(indent, it.key(), *it.value(), ownText);
    return text;
}

}  // namespace Kdd
