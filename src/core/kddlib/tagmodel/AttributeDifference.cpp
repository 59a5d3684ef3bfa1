#include "kddlib/tagmodel/AttributeDifference.h"

#include "kddlib/tagmodel/TagMap.h"
#include "kddlib/tagmodel/TagSequence.h"

#include <QString>

namespace Kdd
{

namespace
{

using Report = std::function<bool(const AttributeDifference&)>;

/// Walks two views side by side, and the items of their sequences likewise.
class NodeComparison
{
public:
    explicit NodeComparison(const Report& report)
        : mReport(report)
    {
    }

    /// False when whoever is told has had enough.
    bool compare(const TagMap& left, const TagMap& right, const QByteArray& path)
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
            if (hasMine && hasTheirs && !entry({path, key, &left, &right}, *mine.value(), *theirs.value()))
                return false;
            if (hasMine != hasTheirs &&
                !tell({path, key, hasMine ? &left : nullptr, hasTheirs ? &right : nullptr}))
                return false;
            if (hasMine)
                ++mine;
            if (hasTheirs)
                ++theirs;
        }
        return true;
    }

private:
    bool tell(const AttributeDifference& difference)
    {
        return difference.key.getGroup() == 0x0006 || mReport(difference);
    }

    bool entry(const AttributeDifference& both, const TagElement& mine, const TagElement& theirs)
    {
        // A sequence and a value differ whatever is in them.
        if (!mine.isSequence() || !theirs.isSequence())
            return (mine.isSequence() == theirs.isSequence() && mine.compare(theirs, true, nullptr)) ||
                   tell(both);
        const auto& left = static_cast<const TagSequence&>(mine);
        const auto& right = static_cast<const TagSequence&>(theirs);
        // Items have no names, so of different numbers none can be told to belong together.
        if (left.numItems() != right.numItems())
            return tell(both);
        const QByteArray path = both.path + QString::asprintf("(%04x,%04x)", unsigned(both.key.getGroup()),
                                                              unsigned(both.key.getElement()))
                                                .toLatin1();
        for (int i = 0; i < left.numItems(); ++i)
            if (!compare(left.itemToRead(i), right.itemToRead(i), path + '[' + QByteArray::number(i) + "]."))
                return false;
        return true;
    }

    const Report& mReport;
};

}  // namespace

void compareNodes(const TagMap& left, const TagMap& right, const Report& report)
{
    NodeComparison(report).compare(left, right, QByteArray());
}

}  // namespace Kdd
