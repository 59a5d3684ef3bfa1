#include "kddlib/tagmodel/AttributeNames.h"
#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"

#include <QString>
#include <QStringList>

#include <cstdlib>

namespace Kdd
{

namespace
{

/// The item that one part of a path ("name[index]") names below `node`; null when there is none.
const TagMap* itemOf(const TagMap& node, const QString& part)
{
    const int bracket = part.indexOf(QLatin1Char('['));
    DcmTagKey key;
    if (bracket < 1 || !resolveAttributeName(part.left(bracket), key))
        return nullptr;
    const TagElement* element = node.findElement(key);
    if (element == nullptr || !element->isSequence())
        return nullptr;
    const auto* sequence = static_cast<const TagSequence*>(element);
    // The number ends at the closing bracket, which is not insisted on; without any digits it is item 0.
    const long index = std::strtol(part.mid(bracket + 1).toLatin1().constData(), nullptr, 10);
    return index >= 0 && index < sequence->numItems() ? sequence->item(static_cast<int>(index)) : nullptr;
}

}  // namespace

TagElement* TagMap::findElement(const QString& path, const DcmTagKey& key) const
{
    const TagMap* node = this;
    for (const QString& part : path.split(QLatin1Char('.'), Qt::SkipEmptyParts)) {
        node = itemOf(*node, part);
        if (node == nullptr)
            return nullptr;
    }
    return node->findElement(key);
}

}  // namespace Kdd
