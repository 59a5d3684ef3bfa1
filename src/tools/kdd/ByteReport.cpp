#include "tools/kdd/ByteReport.h"

#include "tools/kdd/AttributeText.h"
#include "tools/kdd/Report.h"

#include <kddlib/ByteMap.h>
#include <kddlib/OwnAttributes.h>
#include <kddlib/TagMap.h>

#include <algorithm>
#include <cstdio>

namespace Kdd
{

namespace
{

using Part = ByteMap::Part;

constexpr const char* kItems = "items";

const char* nameOf(Part part)
{
    switch (part) {
    case Part::Study:
        return "study";
    case Part::Series:
        return "series";
    case Part::Image:
        return "image";
    case Part::Volumes:
        return "volumes";
    case Part::ImagePreviews:
        return "previews of images";
    case Part::VolumePreviews:
        return "previews of volumes";
    case Part::Frame:
        return "frame";
    case Part::Unread:
        return "unread";
    case Part::LeftOver:
        break;
    }
    return "left over";
}

/// What a user calls an attribute of ours, which no dictionary knows.
QByteArray ownName(const DcmTagKey& key)
{
    const struct
    {
        DcmTagKey key;
        const char* name;
    } names[] = {{kFilePath, "file path"},
                 {kFileSuffix, "file name suffix"},
                 {kTransferSyntax, "transfer syntax"},
                 {kVolumeIndex, "volumes of the image"},
                 {kPreviewIndex, "number of the preview"},
                 {kFromDatabase, "known to the database"},
                 {kHasVolumeFile, "has a volume file"},
                 {kAbstract, "label"}};
    for (const auto& each : names) {
        if (each.key == key)
            return each.name;
    }
    return {};
}

QByteArray attributeName(const QVector<DcmTagKey>& path)
{
    if (path.isEmpty())
        return "heads of records";
    const QByteArray own = ownName(path.last());
    // Without a node there is no creator, so private attributes have no name here.
    return own.isEmpty() ? keywordOf(TagMap(), path.last()) : own;
}

/// "(0008,1140).(0008,1155)"
QByteArray pathText(const QVector<DcmTagKey>& path)
{
    QByteArray text;
    for (const DcmTagKey& key : path)
        text += (text.isEmpty() ? "" : ".") + keyText(key);
    return text;
}

struct Group
{
    QByteArray name;
    ByteMap::Cost cost;
};

void add(const ByteMap::Cost& cost, ByteMap::Cost& sum)
{
    sum.entries += cost.entries;
    sum.before += cost.before;
    sum.after += cost.after;
}

/// The parts, with what stands in items for itself, in the order of a file's levels.
QVector<Group> groupsOf(const QVector<ByteMap::Entry>& entries)
{
    QVector<Group> groups;
    const auto groupOf = [&groups](const QByteArray& name) -> Group& {
        for (Group& group : groups) {
            if (group.name == name)
                return group;
        }
        groups.append(Group{name, {}});
        return groups.last();
    };
    for (const ByteMap::Entry& entry : entries) {
        if (entry.part == Part::Volumes)
            groupOf(kItems);
        add(entry.cost, groupOf(entry.path.size() > 1 ? kItems : nameOf(entry.part)).cost);
    }
    return groups;
}

bool isAttribute(const ByteMap::Entry& entry)
{
    return entry.part == Part::Study || entry.part == Part::Series || entry.part == Part::Image;
}

QVector<ByteMap::Entry> dearest(QVector<ByteMap::Entry> entries)
{
    entries.erase(std::remove_if(entries.begin(), entries.end(),
                                 [](const ByteMap::Entry& entry) {
                                     return !isAttribute(entry) || entry.cost.entries == 0;
                                 }),
                  entries.end());
    std::stable_sort(entries.begin(), entries.end(), [](const ByteMap::Entry& a, const ByteMap::Entry& b) {
        return a.cost.after != b.cost.after ? a.cost.after > b.cost.after : a.cost.before > b.cost.before;
    });
    return entries;
}

QStringList costCells(const ByteMap::Cost& cost, qint64 all)
{
    return {QString::number(cost.entries), QString::number(cost.before), QString::number(cost.after),
            QString::asprintf("%.1f", all > 0 ? 100.0 * double(cost.after) / double(all) : 0.0)};
}

QJsonObject costJson(const ByteMap::Cost& cost)
{
    return {{QStringLiteral("entries"), cost.entries},
            {QStringLiteral("before"), cost.before},
            {QStringLiteral("after"), cost.after}};
}

const QStringList kCostHeads = {QStringLiteral("ENTRIES "), QStringLiteral("BEFORE "),
                                QStringLiteral("AFTER "), QStringLiteral("% ")};

void printTables(const QVector<Group>& groups, const ByteMap::Cost& sum,
                 const QVector<ByteMap::Entry>& listed, int others)
{
    QList<QStringList> rows{QStringList{QStringLiteral("PART")} + kCostHeads};
    for (const Group& group : groups) {
        if (group.cost.entries > 0)
            rows.append(QStringList{QString::fromLatin1(group.name)} + costCells(group.cost, sum.after));
    }
    rows.append(QStringList{QStringLiteral("all")} + costCells(sum, sum.after));
    printTable(rows);
    std::printf("\n");
    rows = {QStringList{QStringLiteral("NODE"), QStringLiteral("ATTRIBUTE"), QStringLiteral("NAME")} +
            kCostHeads};
    for (const ByteMap::Entry& entry : listed)
        rows.append(QStringList{QString::fromLatin1(nameOf(entry.part)),
                                QString::fromLatin1(pathText(entry.path)),
                                displayText(attributeName(entry.path))} +
                    costCells(entry.cost, sum.after));
    printTable(rows);
    if (others > 0)
        std::printf("%d more with --all\n", others);
}

void printJson(const QVector<Group>& groups, const ByteMap::Cost& sum, const QVector<ByteMap::Entry>& listed,
               QJsonObject result)
{
    QJsonArray parts;
    for (const Group& group : groups) {
        QJsonObject part = costJson(group.cost);
        part.insert(QStringLiteral("part"), QString::fromLatin1(group.name));
        parts.append(part);
    }
    QJsonArray attributes;
    for (const ByteMap::Entry& entry : listed) {
        QJsonObject attribute = costJson(entry.cost);
        attribute.insert(QStringLiteral("node"), QString::fromLatin1(nameOf(entry.part)));
        attribute.insert(QStringLiteral("path"), QString::fromLatin1(pathText(entry.path)));
        attribute.insert(QStringLiteral("name"), displayText(attributeName(entry.path)));
        attributes.append(attribute);
    }
    result.insert(QStringLiteral("before"), sum.before);
    result.insert(QStringLiteral("after"), sum.after);
    result.insert(QStringLiteral("parts"), parts);
    result.insert(QStringLiteral("attributes"), attributes);
    Kdd::printJson(result);
}

}  // namespace

void printBytes(const GlobalOptions& options, const ByteMap& map, int failed, bool all)
{
    const QVector<ByteMap::Entry> entries = map.entries();
    const QVector<Group> groups = groupsOf(entries);
    ByteMap::Cost sum;
    for (const Group& group : groups)
        add(group.cost, sum);
    const QVector<ByteMap::Entry> sorted = dearest(entries);
    const QVector<ByteMap::Entry> listed = all ? sorted : sorted.mid(0, kDearestAttributes);
    const int others = sorted.size() - listed.size();
    if (options.json)
        printJson(groups, sum, listed,
                  {{QStringLiteral("studies"), map.files()},
                   {QStringLiteral("failed"), failed},
                   {QStringLiteral("notListed"), others}});
    else
        printTables(groups, sum, listed, others);
}

}  // namespace Kdd
