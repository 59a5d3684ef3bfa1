#include "server/browser/Difference.h"

#include "server/browser/ShownValue.h"

#include <QJsonArray>

#include <kddlib/AttributeDifference.h>
#include <kddlib/TagElement.h>
#include <kddlib/TagMap.h>
#include <kddlib/TagSequence.h>

namespace Kdd::Browser
{
namespace
{

QJsonValue sideOf(const TagMap* node, const DcmTagKey& key, const QByteArray& around)
{
    const TagElement* element = node == nullptr ? nullptr : node->findElement(key);
    if (element == nullptr)
        return {};
    QJsonObject side{{QStringLiteral("vr"), vrOf(*node, key, *element)}};
    if (element->markedAsOmitted()) {
        side.insert(QStringLiteral("omitted"), true);
    } else if (element->isSequence()) {
        side.insert(QStringLiteral("count"), static_cast<const TagSequence&>(*element).numItems());
    } else {
        const ShownValue value = shownValue(*node, key, characterSetOf(*node, around));
        side.insert(QStringLiteral("value"), value.text);
        if (value.isCut())
            side.insert(QStringLiteral("length"), value.length);
    }
    return side;
}

}  // namespace

QJsonObject differenceOf(const TagMap& a, const TagMap& b)
{
    const QByteArray characterSetA = characterSetOf(a);
    const QByteArray characterSetB = characterSetOf(b);
    QJsonArray differences;
    bool isComplete = true;
    compareNodes(a, b, [&](const AttributeDifference& difference) {
        isComplete = differences.size() < kMaxDifferences;
        if (!isComplete)
            return false;
        // A private name needs the creator, which stands where the attribute does.
        const TagMap& named = difference.left != nullptr ? *difference.left : *difference.right;
        differences.append(
            QJsonObject{{QStringLiteral("path"), QString::fromLatin1(difference.path)},
                        {QStringLiteral("tag"), keyDigits(difference.key)},
                        {QStringLiteral("name"), keywordOf(named, difference.key)},
                        {QStringLiteral("a"), sideOf(difference.left, difference.key, characterSetA)},
                        {QStringLiteral("b"), sideOf(difference.right, difference.key, characterSetB)}});
        return true;
    });
    return {{QStringLiteral("differences"), differences}, {QStringLiteral("complete"), isComplete}};
}

}  // namespace Kdd::Browser
