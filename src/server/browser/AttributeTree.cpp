#include "server/browser/AttributeTree.h"

#include "server/browser/ShownValue.h"

#include <QJsonArray>
#include <QMap>

#include <kddlib/TagElement.h>
#include <kddlib/TagMap.h>
#include <kddlib/TagSequence.h>

namespace Kdd::Browser
{
namespace
{

constexpr int kLevels = 3;
constexpr const char* kLevelNames[kLevels] = {"study", "series", "image"};

// The items of one number in the sequences of one key, by the level of the nodes that hold these; null where a node has
// no such item. For the image itself the three nodes.
struct Holders
{
    const TagMap* nodes[kLevels];
};

/// Who holds what a node shows under a key.
struct Shown
{
    const TagElement* element = nullptr;
    int level = 0;
    bool hides = false;  ///< a missing mark with something above it
};

using View = QMap<DcmTagKey, Shown>;

int levelOf(const TagMap& node, const Holders& holders, int fallback)
{
    for (int level = 0; level < kLevels; ++level)
        if (holders.nodes[level] == &node)
            return level;
    return fallback;
}

/// The merged view, marks included: the nearest node that says something of a key counts.
View viewOf(const TagMap& node, const Holders& holders, int ownLevel)
{
    View view;
    for (const TagMap* at = &node; at != nullptr; at = at->parent()) {
        const int level = levelOf(*at, holders, ownLevel);
        const TagMap::Tags& tags = at->tagsForLevel();
        for (auto it = tags.begin(); it != tags.end(); ++it) {
            Shown& shown = view[it.key()];
            if (shown.element == nullptr)
                shown = {it.value(), level, false};
            else if (shown.element->markedAsMissing() && !it.value()->markedAsMissing())
                shown.hides = true;
        }
    }
    return view;
}

Holders itemHolders(const Holders& holders, const DcmTagKey& key, int index)
{
    Holders items = {};
    for (int level = 0; level < kLevels; ++level) {
        const TagElement* element = holders.nodes[level] == nullptr
                                        ? nullptr
                                        : holders.nodes[level]->tagsForLevel().value(key, nullptr);
        if (element == nullptr || !element->isSequence())
            continue;
        const auto& sequence = static_cast<const TagSequence&>(*element);
        items.nodes[level] = index < sequence.numItems() ? sequence.item(index) : nullptr;
    }
    return items;
}

class TreeWriter
{
public:
    QJsonArray attributes(const TagMap& node, const Holders& holders, int ownLevel, const QByteArray& around)
    {
        const QByteArray characterSet = characterSetOf(node, around);
        const View view = viewOf(node, holders, ownLevel);
        // Before its items are looked at: however many these are, none of the node's own attributes is left out for them.
        int left = qMin(view.size(), mEntriesLeft);
        mEntriesLeft -= left;
        mIsComplete = mIsComplete && left == view.size();
        QJsonArray written;
        for (auto it = view.begin(); it != view.end() && left > 0; ++it, --left) {
            const Shown& shown = it.value();
            if (it.key().getGroup() != 0x0006 && (!shown.element->markedAsMissing() || shown.hides))
                written.append(attribute(node, holders, it.key(), shown, characterSet));
        }
        return written;
    }

    bool isComplete() const { return mIsComplete; }

private:
    QJsonObject attribute(const TagMap& node, const Holders& holders, const DcmTagKey& key,
                          const Shown& shown, const QByteArray& characterSet)
    {
        QJsonObject object{{QStringLiteral("tag"), keyDigits(key)},
                           {QStringLiteral("name"), keywordOf(node, key)},
                           {QStringLiteral("origin"), QLatin1String(kLevelNames[shown.level])}};
        if (shown.element->markedAsMissing()) {
            object.insert(QStringLiteral("hidden"), true);
            return object;
        }
        object.insert(QStringLiteral("vr"), vrOf(node, key, *shown.element));
        if (const char* creator = node.privateCreator(key))
            object.insert(QStringLiteral("creator"), QString::fromLatin1(creator));
        if (shown.element->markedAsOmitted())
            object.insert(QStringLiteral("omitted"), true);
        else if (shown.element->isSequence())
            addItems(object, static_cast<const TagSequence&>(*shown.element), holders, key, shown.level,
                     characterSet);
        else
            addValue(object, shownValue(node, key, characterSet));
        return object;
    }

    static void addValue(QJsonObject& object, const ShownValue& value)
    {
        object.insert(QStringLiteral("value"), value.text);
        if (value.isCut())
            object.insert(QStringLiteral("length"), value.length);
    }

    void addItems(QJsonObject& object, const TagSequence& sequence, const Holders& holders,
                  const DcmTagKey& key, int level, const QByteArray& characterSet)
    {
        QJsonArray items;
        for (int i = 0; i < qMin(sequence.numItems(), kMaxShownItems) && mEntriesLeft > 0; ++i)
            items.append(
                attributes(sequence.itemToRead(i), itemHolders(holders, key, i), level, characterSet));
        if (items.size() < sequence.numItems())
            mIsComplete = false;
        object.insert(QStringLiteral("count"), sequence.numItems());
        object.insert(QStringLiteral("items"), items);
    }

    int mEntriesLeft = kMaxTreeEntries;
    bool mIsComplete = true;
};

}  // namespace

QJsonObject attributeTree(const TagMap& image)
{
    const TagMap* series = image.parent();
    const TagMap* study = series == nullptr ? nullptr : series->parent();
    TreeWriter writer;
    const QJsonArray attributes =
        writer.attributes(image, {{study, series, &image}}, kLevels - 1, QByteArray());
    return {{QStringLiteral("attributes"), attributes}, {QStringLiteral("complete"), writer.isComplete()}};
}

}  // namespace Kdd::Browser
