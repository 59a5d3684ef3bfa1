#include "tools/kdd/AttributeDiff.h"

#include "tools/kdd/AttributeText.h"

#include <kddlib/TagMap.h>
#include <kddlib/TagSequence.h>

namespace Kdd
{

namespace
{

using Report = std::function<void(const AttributeDifference&)>;

/// The value as a difference shows it. Sequences and omitted values have none to show.
QByteArray describe(const TagMap& node, const TagMap::iterator& it)
{
    const TagElement& element = *it.value();
    if (element.isSequence())
        return "SQ of " + QByteArray::number(static_cast<const TagSequence&>(element).numItems()) + " items";
    if (element.markedAsOmitted())
        return "omitted";
    QByteArray text;
    node.findAndGetString(it.key(), text);
    return QByteArray(vrName(element.vr())) + " [" + text + ']';
}

/// Walks two views side by side, and the items of their sequences likewise.
class NodeComparison
{
public:
    explicit NodeComparison(const Report& report)
        : mReport(report)
    {
    }

    void compare(const TagMap& left, const TagMap& right, const QByteArray& prefix)
    {
        // Both views are in the order of their keys, so one walk through both finds what either of them
        // lacks.
        const TagMap::iterator end = left.end();
        TagMap::iterator mine = left.begin();
        TagMap::iterator theirs = right.begin();
        while (mine != end || theirs != end) {
            const bool hasMine = mine != end && (theirs == end || mine.key() <= theirs.key());
            const bool hasTheirs = theirs != end && (mine == end || theirs.key() <= mine.key());
            const DcmTagKey key = hasMine ? mine.key() : theirs.key();
            if (key.getGroup() != 0x0006)
                entry(key, prefix, left, hasMine ? &mine : nullptr, right, hasTheirs ? &theirs : nullptr);
            if (hasMine)
                ++mine;
            if (hasTheirs)
                ++theirs;
        }
    }

private:
    void entry(const DcmTagKey& key, const QByteArray& prefix, const TagMap& left,
               const TagMap::iterator* mine, const TagMap& right, const TagMap::iterator* theirs)
    {
        if (mine != nullptr && theirs != nullptr &&
            !differ(*mine->value(), *theirs->value(), prefix + keyText(key)))
            return;
        // A private name needs the creator, which stands where the attribute does.
        const TagMap& named = mine != nullptr ? left : right;
        mReport({prefix + keyText(key), keywordOf(named, key), mine != nullptr ? describe(left, *mine) : "-",
                 theirs != nullptr ? describe(right, *theirs) : "-"});
    }

    /// Whether the two elements themselves differ; what differs inside of equally long sequences is reported there.
    bool differ(const TagElement& mine, const TagElement& theirs, const QByteArray& path)
    {
        if (!mine.isSequence() || !theirs.isSequence())
            // A sequence and a value differ whatever is in them.
            return mine.isSequence() != theirs.isSequence() || !mine.compare(theirs, true, nullptr);
        const auto& left = static_cast<const TagSequence&>(mine);
        const auto& right = static_cast<const TagSequence&>(theirs);
        // Items have no names, so of different numbers none can be told to belong together.
        if (left.numItems() != right.numItems())
            return true;
        for (int i = 0; i < left.numItems(); ++i)
            compare(left.itemToRead(i), right.itemToRead(i), path + '[' + QByteArray::number(i) + "].");
        return false;
    }

    const Report& mReport;
};

}  // namespace

void compareNodes(const TagMap& left, const TagMap& right, const Report& report)
{
    NodeComparison(report).compare(left, right, QByteArray());
}

}  // namespace Kdd
