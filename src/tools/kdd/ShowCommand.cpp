#include "tools/kdd/AttributeText.h"
#include "tools/kdd/NodeLookup.h"
#include "tools/kdd/Report.h"
#include "tools/kdd/Selection.h"

#include <QTextStream>

#include <dcmtk/dcmdata/dcdeftag.h>
#include <kddlib/DicomJson.h>
#include <kddlib/TagMap.h>

#include <cstdio>
#include <iostream>
#include <memory>

namespace Kdd
{

namespace
{

struct ShowOptions
{
    NodeSelection node;
    bool own = false;   ///< the node's own entries instead of the merged view
    bool tree = false;  ///< one line for each node instead of attributes
};

/// One line: what tells the node from its neighbours, and how many values it holds itself.
QString describe(const TagMap& node, int depth)
{
    const QString own = QStringLiteral("  (%1 own)").arg(node.tagsForLevel().size());
    switch (depth) {
    case 0:
        return QStringLiteral("study %1  %2  %3")
                   .arg(displayValue(node, DCM_StudyInstanceUID), displayValue(node, DCM_StudyDate),
                        displayValue(node, DCM_StudyDescription)) +
               own;
    case 1:
        return QStringLiteral("series %1  %2  %3  %4 images")
                   .arg(displayValue(node, DCM_SeriesInstanceUID), displayValue(node, DCM_Modality),
                        displayValue(node, DCM_SeriesDescription))
                   .arg(node.children().size()) +
               own;
    default:
        return QStringLiteral("image %1  number %2")
                   .arg(displayValue(node, DCM_SOPInstanceUID), displayValue(node, DCM_InstanceNumber)) +
               own;
    }
}

/// Down to `lowest`: 0 is the study, 1 its series, 2 the images.
void printTree(const TagMap& node, int depth, int lowest)
{
    std::printf("%*s%s\n", depth * 2, "", qUtf8Printable(describe(node, depth)));
    if (depth == lowest)
        return;
    for (const TagMap* child : node.children())
        printTree(*child, depth + 1, lowest);
}

void printAttributes(const TagMap& node, bool own)
{
    QString text;
    QTextStream stream(&text);
    if (own)
        node.listContent(stream, 0);
    else
        node.dump(stream, 0);
    stream.flush();
    // The listing carries the bytes of the file's own character set; what a terminal must not get is taken out.
    for (const QByteArray& line : text.toLatin1().split('\n')) {
        if (!line.isEmpty())
            std::printf("%s\n", qUtf8Printable(displayText(node, line)));
    }
}

void writeAttributes(const TagMap& node, bool own)
{
    if (own)
        writeOwnDicomJson(std::cout, node, bulkDataRoot(node));
    else
        writeDicomJson(std::cout, node, bulkDataRoot(node));
    std::cout << '\n' << std::flush;
}

/// A node with its number of own entries and the nodes below it.
QJsonObject treeOf(const TagMap& node, int depth)
{
    const auto value = [&node](const DcmTagKey& key) { return displayValue(node, key); };
    QJsonObject tree{{QStringLiteral("own"), node.tagsForLevel().size()}};
    if (depth == 0) {
        tree.insert(QStringLiteral("study"), value(DCM_StudyInstanceUID));
        tree.insert(QStringLiteral("date"), value(DCM_StudyDate));
        tree.insert(QStringLiteral("description"), value(DCM_StudyDescription));
    } else if (depth == 1) {
        tree.insert(QStringLiteral("series"), value(DCM_SeriesInstanceUID));
        tree.insert(QStringLiteral("modality"), value(DCM_Modality));
        tree.insert(QStringLiteral("description"), value(DCM_SeriesDescription));
    } else {
        tree.insert(QStringLiteral("image"), value(DCM_SOPInstanceUID));
        tree.insert(QStringLiteral("number"), value(DCM_InstanceNumber));
        return tree;
    }
    QJsonArray children;
    for (const TagMap* child : node.children())
        children.append(treeOf(*child, depth + 1));
    tree.insert(QStringLiteral("children"), children);
    return tree;
}

Outcome runShow(const GlobalOptions& options, const ShowOptions& show)
{
    TagFile file;
    const TagMap* node = findNode(show.node, file);
    if (node == nullptr)
        return Outcome::Failed;
    if (options.json && show.tree)
        printJson(treeOf(*node, depthOf(*node)));
    else if (options.json)
        writeAttributes(*node, show.own);
    // The images of a whole study are too many to be listed unasked.
    else if (show.tree)
        printTree(*node, depthOf(*node), options.verbose || depthOf(*node) > 0 ? 2 : 1);
    else
        printAttributes(*node, show.own);
    return Outcome::Done;
}

}  // namespace

void declareShow(CommandSet& commands)
{
    const CommandText text = {
        "show", kLooking, "Show the attributes of a node",
        "The node is the study, or with --series or --image one of its series or images. --json gives its "
        "attributes as one object of DICOM JSON, and --tree --json the tree down to the images.",
        "kdd show 2.25.2062 --tree\n"
        "kdd show 2.25.2062 --image 2.25.118095209191961083373906363074726608325\n"
        "kdd --json show 2.25.2062 --own        # what all images of the study share"};
    const auto request = std::make_shared<ShowOptions>();
    ArgumentList arguments = commands.declare(
        text, [request](const GlobalOptions& options) { return runShow(options, *request); });
    request->node.addTo(arguments);
    arguments.flag("--own", request->own, "Only what the node itself holds, not what it inherits");
    arguments.flag("--tree", request->tree, "The nodes below instead of attributes");
}

}  // namespace Kdd
